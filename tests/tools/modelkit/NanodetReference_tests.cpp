// The converted detector network against the original model: features the
// library computes through its own loader and input preparation, compared
// with reference vectors that TensorFlow.js computed from the same canvases
// (scripts/reference/make-nanodet-reference.sh). Runs when
// scripts/fetch-network.sh has put the network in .cache/network/.

#include <stdio.h>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>
#include <opencv2/imgcodecs.hpp>

#include "KitTesting.h"
#include "model/FeatureNetwork.h"
#include "modelkit/Photos.h"
#include "modelkit/TfjsConverter.h"
#include "semantic/NetworkInput.h"

namespace {

using kit_testing::TempDir;
namespace fs = std::filesystem;

const fs::path kSource(VORA_SOURCE_DIR);

// The inputs: two sample portraits and a synthetic scene that needs no download.
std::vector<std::pair<std::string, cv::Mat>> Inputs() {
    std::vector<std::pair<std::string, cv::Mat>> inputs;
    for (const char* name : {"grace_hopper.jpg", "astronaut.png"}) {
        const fs::path photo = kSource / ".cache/photos/content" / name;
        if (fs::exists(photo)) inputs.emplace_back(fs::path(name).stem().string(), vora::modelkit::ReadPhotoBgr(photo.string()));
    }
    inputs.emplace_back("scene", kit_testing::Scene(7, 300, 400));
    return inputs;
}

// The canvases the reference script reads, written when asked to remake them.
TEST(NanodetReference, WritesTheCanvasesWhenAsked) {
    const char* dir = std::getenv("VORA_WRITE_REFERENCE_INPUTS");
    if (!dir) GTEST_SKIP() << "only for scripts/reference/make-nanodet-reference.sh";
    for (const auto& [name, photo] : Inputs()) {
        cv::Mat canvas;
        vora::PrepareNetworkImage(photo, canvas, vora::kNetworkImageSize, vora::kNetworkInputSize);
        ASSERT_TRUE(cv::imwrite((fs::path(dir) / (name + ".ppm")).string(), canvas));
    }
}

TEST(NanodetReference, ConvertedNetworkMatchesTheOriginalModel) {
    const fs::path networkDir = kSource / ".cache/network";
    if (!fs::exists(networkDir / vora::modelkit::kNanodetWeightsName))
        GTEST_SKIP() << "no detector network; run scripts/fetch-network.sh";
    if (std::getenv("VORA_WRITE_REFERENCE_INPUTS")) GTEST_SKIP() << "remaking the reference";
    std::ifstream file(kSource / "tests/tools/modelkit/data/nanodet-reference.json");
    ASSERT_TRUE(file) << "reference vectors missing";
    const nlohmann::json reference = nlohmann::json::parse(file);
    TempDir dir;
    vora::modelkit::WriteNetworkFiles(vora::modelkit::ConvertTfjs(vora::modelkit::NanodetConversion(networkDir.string())),
                                      dir.path.string());
    auto network = vora::FeatureNetwork::Load((dir.path / vora::kNetworkDefinitionName).string(),
                                              (dir.path / vora::kNetworkWeightsName).string());
    const double tolerance = reference.at("tolerance").get<double>();
    int compared = 0;
    for (const auto& [name, photo] : Inputs()) {
        SCOPED_TRACE(name);
        std::vector<float> feature(512, NAN);
        ASSERT_TRUE(vora::ExtractFeature(*network, photo, feature.data()));
        const std::vector<float> expected = reference.at("features").at(name).get<std::vector<float>>();
        ASSERT_EQ(expected.size(), 512u);
        double worst = 0.0;
        for (int i = 0; i < 512; ++i) worst = std::max(worst, std::fabs(double(feature[i]) - expected[i]));
        std::printf("%s: largest difference %.3g\n", name.c_str(), worst);
        EXPECT_LE(worst, tolerance);
        ++compared;
    }
    EXPECT_EQ(compared, static_cast<int>(reference.at("features").size())) << "a photo the reference covers is missing";
}

}  // namespace
