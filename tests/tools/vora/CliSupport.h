#pragma once

// Running the built vora tool from tests: in a work folder of its own, on a
// fixture model, with its exit status and both output streams captured.

#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <opencv2/core.hpp>
#include <vora/vora.h>

#include "support/ModelFixtures.h"
#include "support/TestImages.h"

namespace vora {
namespace clitest {

struct RunResult {
    int status = -1;
    std::string out;
    std::string err;
};

using fixtures::ReadBytes;
using testimages::ImageHandle;
using testimages::SameRecord;
using testimages::SyntheticPhotoRgb;

// Runs the tool in folder cwd without $VORA_MODEL; its output is captured
// outside that folder so that the folder holds only what the tool wrote.
RunResult RunVora(const std::string& cwd, const std::vector<std::string>& args);

// Every path below root, relative to it.
std::set<std::string> ListTree(const std::string& root);

// Writes or reads an image file of R, G, B(, A) pixels (or grey).
void WriteRgb(const std::string& path, const cv::Mat& rgbOrGrey);
cv::Mat ReadRgb(const std::string& path);

// The ICC profile an image file carries (empty if none), and a profile's
// description, read with exiv2 and Little CMS rather than the tool's own code.
std::string EmbeddedProfile(const std::string& path);
std::string ProfileDescription(const std::string& iccBytes);

// Same size, type and bytes.
bool SameBytes(const cv::Mat& a, const cv::Mat& b);

// Library result for a whole image, the reference every rendering is held to.
cv::Mat ApplyDirect(const vora_api& api, const cv::Mat& pixels, const TRANSFER& t);

// What --strength S documents: each colour byte o + S x (r - o), in double,
// rounded half up.
cv::Mat Mixed(const cv::Mat& original, const cv::Mat& restyled, double strength);

// The dark oval of SyntheticPhotoRgb, given as the face.
inline constexpr char kFace[] = "0.3,0.5,0.25,0.55";

// A work folder holding photo.png, removed after the test, and a fixture
// model with the facade opened on it.
class CliTest : public ::testing::Test {
protected:
    void SetUp() override { WriteRgb(m_work + "/photo.png", m_photo); }
    RunResult Run(const std::vector<std::string>& args) { return RunVora(m_work, args); }
    // Writes t.json, the transfer of `photo` toward style 3, and first.png, its rendering.
    bool WriteTransfers(const std::string& photo = "photo.png") {
        return Run({"match", photo, "--style-index", "3", "first.png", "--model", m_modelDir, "--json", "t.json"})
                   .status == 0;
    }

    // Runs a command that must be refused: its status, a single line on
    // standard error that starts with "vora: " and contains `mentions`, and
    // the work folder unchanged.
    void ExpectRefused(const std::vector<std::string>& args, int status, const std::string& mentions);

    fixtures::TempFolder m_workFolder;
    std::string m_work = m_workFolder.path();
    cv::Mat m_photo = SyntheticPhotoRgb(120, 160);
    fixtures::ModelFixture m_model{fixtures::RandomDatabase(4, 12, 7)};
    const std::string m_modelDir = m_model.modelDir();
    const vora_api m_api{m_modelDir};
};

}  // namespace clitest
}  // namespace vora
