// export-cube. The cube holds the tool's own colours at its lattice points;
// read by another program, ffmpeg's lut3d filter with a 65-point cube, it
// renders a real photo as vora apply does, up to the interpolation between
// lattice points (whose colours are rounded to 8 bits) and ffmpeg's
// truncation of its output to bytes. A swapped channel or a transposed
// lattice costs tens of dB.

#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>
#include <opencv2/core.hpp>

#include "tools/vora/CliSupport.h"
#include "vora/TransferJson.h"

namespace {

using namespace vora::clitest;
namespace fs = std::filesystem;

TEST_F(CliTest, FfmpegWithTheCubeReproducesApplyOnARealPhoto) {
    const fs::path photo = fs::path(VORA_SOURCE_DIR) / ".cache/photos/content/grace_hopper.jpg";
    if (std::system("command -v ffmpeg >/dev/null") != 0 || !fs::exists(photo))
        GTEST_SKIP() << "needs ffmpeg and the fetched photos (scripts/fetch-photos.sh)";
    // Both read the same decoded pixels: JPEG decoders differ in their last bits.
    WriteRgb(m_work + "/real.png", ReadRgb(photo.string()));
    ASSERT_TRUE(WriteTransfers("real.png"));
    ASSERT_EQ(Run({"apply", "real.png", "t.json", "vora.png"}).status, 0);
    ASSERT_EQ(Run({"export-cube", "t.json", "look.cube", "--size", "65"}).status, 0);
    const std::string ffmpeg = " && ffmpeg -loglevel error -i real.png -vf lut3d=look.cube:interp=tetrahedral";
    ASSERT_EQ(std::system(("cd '" + m_work + "'" + ffmpeg + " -pix_fmt rgb24 ffmpeg.png").c_str()), 0);

    const cv::Mat ours = ReadRgb(m_work + "/vora.png"), theirs = ReadRgb(m_work + "/ffmpeg.png");
    ASSERT_EQ(ours.size(), theirs.size());
    const double psnr = cv::PSNR(ours, theirs);
    const double largest = cv::norm(ours, theirs, cv::NORM_INF);
    std::cout << "ffmpeg lut3d (65 points, tetrahedral) against vora apply: PSNR " << psnr << " dB, largest difference "
              << largest << " levels\n";
    EXPECT_GE(psnr, 45.0);
    EXPECT_LE(largest, 16.0);
}

TEST_F(CliTest, CubeHoldsTheToolsOwnColoursAtItsLatticePoints) {
    ASSERT_EQ(Run({"suggest", "photo.png", "--model", m_modelDir, "-n", "2", "--faces", kFace, "--out", "s"}).status,
              0);
    vora::TRANSFER colourOnly = vora::cli::ReadTransfersFile(m_work + "/s/transfers.json").transfers[1];
    colourOnly.faceCorrections.clear();  // a lookup table knows only colours
    // At part strength each point is mixed as apply mixes a pixel.
    for (const auto& [size, strength] : std::vector<std::pair<int, std::string>>{{2, "1"}, {17, "1"}, {9, "0.35"}}) {
        SCOPED_TRACE(size);
        const std::string name = "lut" + std::to_string(size) + ".cube";
        const std::string points = std::to_string(size);
        ASSERT_EQ(Run({"export-cube", "s/transfers.json:1", name, "--size", points, "--strength", strength}).status, 0);
        int declared = 0;
        std::vector<cv::Vec3d> domain, values;
        std::istringstream in(ReadBytes(m_work + "/" + name));
        for (std::string line, key; std::getline(in, line);) {
            std::istringstream words(line);
            cv::Vec3d v;
            if (std::istringstream(line) >> v[0] >> v[1] >> v[2]) values.push_back(v);
            else if (words >> key && key == "LUT_3D_SIZE") words >> declared;
            else if (key.rfind("DOMAIN_", 0) == 0 && words >> v[0] >> v[1] >> v[2]) domain.push_back(v);
        }
        EXPECT_EQ(declared, size);
        EXPECT_EQ(domain, (std::vector<cv::Vec3d>{{0, 0, 0}, {1, 1, 1}}));

        // The library's rendering of each lattice colour, red varying fastest.
        std::vector<cv::Vec3b> lattice;
        auto level = [&](int k) { return static_cast<uint8_t>(std::lround(255.0 * k / (size - 1))); };
        for (int b = 0; b < size; ++b)
            for (int g = 0; g < size; ++g)
                for (int r = 0; r < size; ++r) lattice.emplace_back(level(r), level(g), level(b));
        cv::Mat bytes;
        cv::Mat(values).convertTo(bytes, CV_8U, 255.0);  // each value is a byte / 255, to seven decimals
        EXPECT_TRUE(SameBytes(bytes, Mixed(cv::Mat(lattice), ApplyDirect(m_api, cv::Mat(lattice), colourOnly),
                                           std::stod(strength))));
    }
}

}  // namespace
