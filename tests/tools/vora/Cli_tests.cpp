// The tool's refusals, one table for every command: the exit status, the one
// line on standard error, and nothing written.

#include <filesystem>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>
#include <opencv2/imgcodecs.hpp>

#include "tools/vora/CliSupport.h"

namespace {

using namespace vora::clitest;

TEST_F(CliTest, BadInputGetsItsMessageAndStatusAndWritesNothing) {
    const std::string& m = m_modelDir;
    ASSERT_TRUE(WriteTransfers());
    vora::fixtures::WriteBytes(m_work + "/garbage.jpg", "this is not a picture");
    vora::fixtures::WriteBytes(m_work + "/broken.json", "{\"format\": \"vora-transfers\", ");
    vora::fixtures::WriteBytes(m_work + "/future.json", "{\"format\": \"vora-transfers\", \"version\": 9}");
    // A 16384 x 16384 PNG of a few hundred kilobytes (decoding it took 7 GB),
    // and the first half of a JPEG (it rendered with streaks and exit 0).
    ASSERT_TRUE(cv::imwrite(m_work + "/huge.png", cv::Mat(16384, 16384, CV_8UC1, cv::Scalar(9))));
    std::vector<uchar> jpeg;
    ASSERT_TRUE(cv::imencode(".jpg", cv::Mat(64, 64, CV_8UC3, cv::Scalar(10, 200, 30)), jpeg));
    vora::fixtures::WriteBytes(m_work + "/half.jpg", std::string(jpeg.begin(), jpeg.begin() + jpeg.size() / 2));
    // A folder left by an earlier run of five proposals, its contact sheet deleted.
    std::filesystem::create_directory(m_work + "/old");
    vora::fixtures::WriteBytes(m_work + "/old/photo-4.jpg", "an earlier proposal");
    using Case = std::tuple<std::vector<std::string>, int, std::string>;  // arguments, status, mentions
    const std::vector<Case> cases = {
        // Usage errors exit 2.
        {{}, 2, "no command given"},
        {{"resize"}, 2, "unknown command 'resize'"},
        {{"suggest", "photo.png", "--model", m, "--colour", "red"}, 2, "unknown option --colour"},
        {{"suggest", "photo.png", "--model", m, "-n", "0"}, 2, "-n"},
        // 12 styles: the library keeps the better 6 per cluster.
        {{"suggest", "photo.png", "--model", m, "-n", "7"}, 2, "6 styles"},
        {{"suggest", "photo.png", "--model", m, "--ranking", "nan"}, 2, "--ranking"},
        {{"suggest", "photo.png", "--model", m, "--preview", "8"}, 2, "--preview"},
        {{"suggest", "photo.png", "--model", m, "--full", "--preview", "100"}, 2, "choose one"},
        {{"suggest", "photo.png", "--model", m, "--solve", "0"}, 2, "--solve"},  // its bound is exclusive
        {{"suggest", "photo.png", "--model", m, "--finish", "3"}, 2, "--finish"},
        {{"suggest", "photo.png", "--model", m, "-n", "2", "--out", "old"}, 2, "old/photo-4.jpg: a proposal of an earlier run"},
        {{"suggest", "photo.png", "--model", m, "--faces", "0.6,0.4,0.1,0.5"}, 2, "0.6,0.4,0.1,0.5"},
        {{"suggest", "photo.png", "--model", m, "--faces", "0.1,0.4,0.5,1.5"}, 2, "--faces"},
        {{"suggest", "photo.png", "--model", m, "--faces", "auto", "--faces", "0.1,0.4,0.1,0.4"}, 2, "auto"},
        {{"match", "photo.png", "--style-index", "12", "out.png", "--model", m}, 2, "--style-index"},
        {{"match", "photo.png", "photo.png", "out.bmp", "--model", m}, 2, "out.bmp"},
        {{"apply", "photo.png", "photo.png"}, 2, "missing arguments"},
        {{"apply", "photo.png", "t.json:1", "out.png", "--model", m}, 2, "t.json: no record 1"},
        {{"apply", "photo.png", "t.json:x", "out.png", "--model", m}, 2, "record index"},
        {{"export-cube", "t.json:3", "lut.cube", "--model", m}, 2, "no record 3"},
        {{"export-cube", "t.json", "lut.cube", "--size", "1"}, 2, "--size"},
        {{"export-cube", "t.json", "lut.txt"}, 2, "lut.txt"},
        {{"apply", "photo.png", "t.json", "first.png", "--model", m}, 2, "first.png: already exists"},
        {{"apply", "photo.png", "t.json", "photo.png", "--model", m}, 2, "photo.png: is an input"},
        {{"match", "photo.png", "photo.png", "o.png", "--model", m, "--json", "t.json"}, 2, "t.json: already exists"},
        // Failures exit 1, naming the file.
        {{"suggest", "garbage.jpg", "--model", m, "--faces", "none"}, 1, "garbage.jpg: cannot read image"},
        {{"suggest", "absent.png", "--model", m}, 1, "absent.png: no such file"},
        {{"apply", "photo.png", "broken.json", "out.png", "--model", m}, 1, "broken.json: not a valid JSON"},
        {{"apply", "photo.png", "future.json", "out.png", "--model", m}, 1, "format version 9"},
        {{"suggest", "photo.png", "--model", m_work + "/nowhere"}, 1, "nowhere"},
        {{"match", "photo.png", "photo.png", "missing/out.png", "--model", m}, 1, "does not exist"},
        {{"suggest", "huge.png", "--model", m}, 1, "huge.png: 16384 x 16384 is more than 128000000 pixels"},
        {{"apply", "huge.png", "t.json", "o.png", "--model", m, "--max-pixels", "1000"}, 1, "more than 1000 pixels"},
        {{"apply", "photo.png", "t.json", "o.png", "--model", m, "--max-pixels", "0"}, 2, "--max-pixels"},
        {{"match", "half.jpg", "photo.png", "o.png", "--model", m}, 1, "half.jpg: cannot read image (the JPEG file is cut short"}};
    for (const auto& [args, status, mentions] : cases) ExpectRefused(args, status, mentions);
    // --force lets an existing output go.
    const RunResult forced = Run({"apply", "photo.png", "t.json", "first.png", "--model", m, "--force"});
    EXPECT_EQ(forced.status, 0) << forced.err;
}

}  // namespace
