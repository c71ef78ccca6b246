// The exported .cube read by another program: ffmpeg's lut3d filter with a
// 65-point cube must render a real photo as vora apply does, up to the
// interpolation between lattice points (whose colours are rounded to 8 bits)
// and ffmpeg's truncation of its output to bytes. A swapped channel or a
// transposed lattice costs tens of dB.

#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <string>

#include <gtest/gtest.h>
#include <opencv2/core.hpp>

#include "tools/vora/CliSupport.h"

namespace {

using namespace vora::clitest;
namespace fs = std::filesystem;

TEST_F(CliTest, FfmpegWithTheCubeReproducesApplyOnARealPhoto) {
    const fs::path photo = fs::path(VORA_SOURCE_DIR) / ".cache/photos/content/grace_hopper.jpg";
    if (std::system("command -v ffmpeg >/dev/null") != 0 || !fs::exists(photo))
        GTEST_SKIP() << "needs ffmpeg and the fetched photos (scripts/fetch-photos.sh)";
    // Both read the same decoded pixels: JPEG decoders differ in their last bits.
    WriteRgb(m_work + "/real.png", ReadRgb(photo.string()));
    ASSERT_EQ(Run({"match", "real.png", "--style-index", "5", "m.png", "--model", m_modelDir, "--json", "t.json"})
                  .status,
              0);
    ASSERT_EQ(Run({"apply", "real.png", "t.json", "vora.png"}).status, 0);
    ASSERT_EQ(Run({"export-cube", "t.json", "look.cube", "--size", "65"}).status, 0);
    ASSERT_EQ(std::system(("cd '" + m_work +
                           "' && ffmpeg -loglevel error -i real.png -vf lut3d=look.cube:interp=tetrahedral "
                           "-pix_fmt rgb24 ffmpeg.png")
                              .c_str()),
              0);

    const cv::Mat ours = ReadRgb(m_work + "/vora.png"), theirs = ReadRgb(m_work + "/ffmpeg.png");
    ASSERT_EQ(ours.size(), theirs.size());
    const double psnr = cv::PSNR(ours, theirs);
    const double largest = cv::norm(ours, theirs, cv::NORM_INF);
    std::cout << "ffmpeg lut3d (65 points, tetrahedral) against vora apply: PSNR " << psnr << " dB, largest difference "
              << largest << " levels\n";
    EXPECT_GE(psnr, 45.0);
    EXPECT_LE(largest, 16.0);
}

}  // namespace
