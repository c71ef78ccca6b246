// build-model: reproducible models that serve, and the choice of network.

#include <filesystem>
#include <string>

#include <gtest/gtest.h>

#include "model/ModelFileNames.h"
#include "tools/vora/CliSupport.h"

namespace {

namespace fs = std::filesystem;
using namespace vora::clitest;

TEST_F(CliTest, BuildModelIsDeterministicAndItsModelWorks) {
    fs::create_directories(m_work + "/styles");
    for (int i = 0; i < 4; ++i)
        WriteRgb(m_work + "/styles/style-" + std::to_string(i) + ".png", SyntheticPhotoRgb(72, 96 + 16 * i, i + 1));
    const RunResult first = Run({"build-model", "--styles", "styles", "--out", "a", "--clusters", "3"});
    ASSERT_EQ(first.status, 0) << first.err;
    EXPECT_NE(first.out.find("3 clusters, 4 styles"), std::string::npos) << first.out;
    ASSERT_EQ(Run({"build-model", "--styles", "styles", "--out", "b/", "--clusters", "3"}).status, 0);
    EXPECT_EQ(ListTree(m_work + "/a").size(), 7u);  // four data files, the net folder and its two files: no staging
    EXPECT_EQ(Run({"inspect", "a"}).status, 0);
    EXPECT_EQ(Run({"suggest", "photo.png", "--model", "a", "-n", "2", "--faces", "none"}).status, 0);

    ExpectRefused({"build-model", "--styles", "styles", "--out", "a"}, 2, "a: already holds a model");
    ExpectRefused({"build-model", "--styles", "styles"}, 2, "--out DIR is required");
    ExpectRefused({"build-model", "--styles", "styles", "--out", "c", "--clusters", "0"}, 2, "--clusters");
    ExpectRefused({"build-model", "--styles", "nowhere", "--out", "c"}, 1, "nowhere: no such folder");
    // The builder's own refusal, after the tool's checks: the folder it would
    // have made is gone again.
    ExpectRefused({"build-model", "--styles", "styles", "--out", "c", "--clusters", "999", "--network", "scene"}, 1,
                  "999 clusters");
    const RunResult forced = Run({"build-model", "--styles", "styles", "--out", "a", "--clusters", "2", "--force"});
    EXPECT_EQ(forced.status, 0) << forced.err;
    EXPECT_NE(ReadBytes(m_work + "/a/" + vora::kClusterFileName), ReadBytes(m_work + "/b/" + vora::kClusterFileName));
}

// Without the detector's files the default is the scene descriptor, with a
// note on how to fetch them; asking for the detector then is refused.
TEST_F(CliTest, BuildModelChoosesItsNetworkAndSaysHowToFetchTheDetector) {
    fs::create_directories(m_work + "/styles");
    fs::create_directories(m_work + "/empty");
    for (int i = 0; i < 2; ++i)
        WriteRgb(m_work + "/styles/style-" + std::to_string(i) + ".png", SyntheticPhotoRgb(72, 96, i + 1));
    ::setenv("VORA_NETWORK_DIR", (m_work + "/empty").c_str(), 1);
    const RunResult byDefault = Run({"build-model", "--styles", "styles", "--out", "a"});
    ExpectRefused({"build-model", "--styles", "styles", "--out", "b", "--network", "nanodet"}, 1,
                  "fetch them with 'bash scripts/fetch-network.sh'");
    ::unsetenv("VORA_NETWORK_DIR");
    EXPECT_EQ(byDefault.status, 0) << byDefault.err;
    EXPECT_NE(byDefault.err.find("bash scripts/fetch-network.sh"), std::string::npos) << byDefault.err;
    EXPECT_NE(ReadBytes(m_work + "/a/net/deploy2.prototxt").find("vora_scene_descriptor"), std::string::npos);

    ExpectRefused({"build-model", "--styles", "styles", "--out", "b", "--network", "imagenet"}, 2, "nanodet or scene");
    ExpectRefused({"build-model", "--styles", "styles", "--out", "b", "--feature", "x"}, 2, "--feature goes with --tfjs");
    ExpectRefused({"build-model", "--styles", "styles", "--out", "b", "--tfjs", "m.json", "--feature", "x"}, 2,
                  "--tfjs needs --mean");
    ExpectRefused({"build-model", "--styles", "styles", "--out", "b", "--tfjs", "m.json", "--feature", "x", "--mean",
                   "1,2", "--std", "1,1,1", "--crop", "225"},
                  2, "--mean takes three numbers");
}

}  // namespace
