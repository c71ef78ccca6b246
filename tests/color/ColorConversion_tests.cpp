#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <limits>

#include "color/ColorConversion.h"
#include "color/ColorTables.h"

namespace vora {
namespace {

int LevelDistance(const Rgb8& out, int red, int green, int blue) {
    return std::max({std::abs(out.red - red), std::abs(out.green - green), std::abs(out.blue - blue)});
}

TEST(ColorConversion, WhiteIsExactBothWays) {
    const LabPixel white = RgbToLab(255, 255, 255);
    EXPECT_EQ(white.lightness01, 1.0f);
    EXPECT_EQ(white.a, 0.0f);
    EXPECT_EQ(white.b, 0.0f);
    const Rgb8 back = LabToRgb(white.lightness01, white.a, white.b);
    EXPECT_EQ(LevelDistance(back, 255, 255, 255), 0);
}

TEST(ColorConversion, BlackIsNearZeroBothWays) {
    const LabPixel black = RgbToLab(0, 0, 0);
    EXPECT_EQ(black.a, 0.0f);
    EXPECT_EQ(black.b, 0.0f);
    EXPECT_NEAR(black.lightness01, 0.0f, 1e-9);
    const Rgb8 back = LabToRgb(black.lightness01, black.a, black.b);
    EXPECT_EQ(LevelDistance(back, 0, 0, 0), 0);
}

TEST(ColorConversion, BytesAreReadAsRedGreenBlue) {
    const LabPixel red = RgbToLab(255, 0, 0);
    const LabPixel green = RgbToLab(0, 255, 0);
    const LabPixel blue = RgbToLab(0, 0, 255);
    EXPECT_GT(red.a, 50.0f);
    EXPECT_LT(green.a, -50.0f);
    EXPECT_LT(blue.b, -50.0f);
    EXPECT_GT(green.lightness01, red.lightness01);
    EXPECT_GT(red.lightness01, blue.lightness01);


    // Back again each primary keeps its own channel; the zero channels come back
    // near black, where the tables are coarse (see the greys below).
    const Rgb8 redBack = LabToRgb(red.lightness01, red.a, red.b);
    const Rgb8 greenBack = LabToRgb(green.lightness01, green.a, green.b);
    const Rgb8 blueBack = LabToRgb(blue.lightness01, blue.a, blue.b);
    EXPECT_GE(redBack.red, 254);
    EXPECT_GE(greenBack.green, 254);
    EXPECT_GE(blueBack.blue, 254);
    EXPECT_LT(std::max({redBack.green, redBack.blue, greenBack.red, greenBack.blue, blueBack.red, blueBack.green}),
              16);
}

// Mid greys lose at most one level. Near black the inverse power table is
// coarser than a byte level (its first step above 0 already encodes to
// several levels), so a dark grey falls to 0 or to the first reachable level.
TEST(ColorConversion, GreysRoundTripWithinTheTableResolution) {
    const int firstReachable = static_cast<int>(inverseGammaTable[1] * 255.0f);
    ASSERT_GT(firstReachable, 1);
    for (int v = 0; v < 256; ++v) {
        const LabPixel lab = RgbToLab(v, v, v);
        const Rgb8 back = LabToRgb(lab.lightness01, lab.a, lab.b);
        if (v >= 16) {
            EXPECT_LE(LevelDistance(back, v, v, v), 1) << "grey " << v;
        } else {
            EXPECT_LT(LevelDistance(back, v, v, v), firstReachable) << "grey " << v;
            EXPECT_TRUE(back.red == 0 || back.red >= firstReachable) << "grey " << v;
        }
    }
}

// Every byte triple: the forward lookups stay inside the tables (L, a and b are
// made of labTable entries, which lie in [16/116, 1]), the results are finite,
// and the inverse conversion of the result is defined. Under the sanitizers a
// lookup outside a table is reported as an out-of-bounds read.
TEST(ColorConversion, EveryByteTripleStaysInsideTheTables) {
    const float fMin = labTable[0];
    const float aLimit = (1.0f - fMin) * 500.0f + 1e-3f;
    const float bLimit = (1.0f - fMin) * 200.0f + 1e-3f;
    size_t outside = 0;
    unsigned checksum = 0;  // keeps the inverse conversion from being optimised away
    for (int r = 0; r < 256; ++r) {
        for (int g = 0; g < 256; ++g) {
            for (int b = 0; b < 256; ++b) {
                const LabPixel lab = RgbToLab(r, g, b);
                const bool inside = std::isfinite(lab.lightness01) && lab.lightness01 >= -1e-9f &&
                                    lab.lightness01 <= 1.0f && std::fabs(lab.a) <= aLimit &&
                                    std::fabs(lab.b) <= bLimit;
                outside += inside ? 0 : 1;
                const Rgb8 back = LabToRgb(lab.lightness01, lab.a, lab.b);
                checksum += back.red + back.green + back.blue;
            }
        }
    }
    EXPECT_EQ(outside, 0u);
    EXPECT_GT(checksum, 0u);
}

// The chroma map can leave the RGB gamut; the inverse conversion must clamp
// rather than index outside its table. NaN clamps to 0.
TEST(ColorConversion, InverseClampsOutOfGamutInput) {
    EXPECT_EQ(LevelDistance(LabToRgb(-1.0f, 0.0f, 0.0f), 0, 0, 0), 0);
    EXPECT_EQ(LevelDistance(LabToRgb(2.0f, 0.0f, 0.0f), 255, 255, 255), 0);
    const Rgb8 vivid = LabToRgb(0.5f, 300.0f, 0.0f);  // red far above 1, green far below 0
    EXPECT_EQ(vivid.red, 255);
    EXPECT_EQ(vivid.green, 0);
    const float nan = std::numeric_limits<float>::quiet_NaN();
    EXPECT_EQ(LevelDistance(LabToRgb(nan, nan, nan), 0, 0, 0), 0);
}

}  // namespace
}  // namespace vora
