#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <set>

#include "transfer/SolveTransfer.h"

namespace vora {

namespace {

ColourStats MakeStats(float meanA, float meanB, std::initializer_list<float> sqrtCov) {
    ColourStats stats{};
    stats.chromaMean[0] = meanA;
    stats.chromaMean[1] = meanB;
    std::copy(sqrtCov.begin(), sqrtCov.end(), stats.chromaSqrtCov);
    for (int i = 0; i < 32; ++i) stats.lightness[i] = static_cast<float>(i / 31.0);
    stats.lightnessLow = 0.12f;
    stats.lightnessHigh = 0.87f;
    return stats;
}

// The curve family, written independently in double.
double Arctan(double x, double a, double w) {
    return (std::atan((x - a) / w) + std::atan(a / w)) / (std::atan(a / w) + std::atan((1.0 - a) / w));
}

void ExpectMatrix(const TRANSFER& t, double m00, double m01, double m10, double m11, double tolerance) {
    EXPECT_NEAR(t.chromaMatrix[0], m00, tolerance);
    EXPECT_NEAR(t.chromaMatrix[1], m01, tolerance);
    EXPECT_NEAR(t.chromaMatrix[2], m10, tolerance);
    EXPECT_NEAR(t.chromaMatrix[3], m11, tolerance);
}

TEST(SolveTransfer, EqualStatisticsGiveTheIdentityMap) {
    // Diagonal above the floor of 15 and a positive off-diagonal: the floor changes nothing.
    const ColourStats content = MakeStats(3.5f, -7.25f, {30.0f, 4.0f, 4.0f, 20.0f});
    ColourStats style = content;
    style.lightnessLow = 0.0f;  // as a database style stores them: never read
    style.lightnessHigh = 0.0f;
    TRANSFER t;
    EXPECT_EQ(SolveTransfer(content, style, t, VoraParameters()), 0);

    ExpectMatrix(t, 1.0, 0.0, 0.0, 1.0, 1e-5);
    EXPECT_EQ(t.contentMean[0], 3.5f);
    EXPECT_EQ(t.contentMean[1], -7.25f);
    EXPECT_EQ(t.styleMean[0], 3.5f);
    EXPECT_EQ(t.styleMean[1], -7.25f);
    EXPECT_EQ(t.lightnessLow, 0.12f);
    EXPECT_EQ(t.lightnessHigh, 0.87f);
    // The best arctan fit to the identity is close to it.
    for (int i = 0; i < 256; ++i) EXPECT_NEAR(t.toneCurve[i], i / 255.0, 0.02) << i;
}

TEST(SolveTransfer, GreyContentGivesTheStyleRootOverTheFloor) {
    const ColourStats content = MakeStats(0.0f, 0.0f, {0.0f, 0.0f, 0.0f, 0.0f});
    const ColourStats style = MakeStats(10.0f, 20.0f, {12.0f, -3.0f, -3.0f, 7.0f});
    for (float factor : {1.0f, 2.0f, 0.5f}) {
        VoraParameters params;
        params.solveFactor = factor;
        TRANSFER t;
        SolveTransfer(content, style, t, params);
        const double k = factor * 15.0;
        ExpectMatrix(t, 12.0 / k, -3.0 / k, -3.0 / k, 7.0 / k, 1e-5);
    }
}

TEST(SolveTransfer, FloorActsOnEveryEntry) {
    // A negative off-diagonal entry is raised to 0, as max(Sc, R) does
    // element-wise; an eigenvalue floor would keep it.
    const ColourStats style = MakeStats(0.0f, 0.0f, {25.0f, 6.0f, 6.0f, 18.0f});
    TRANSFER negative;
    TRANSFER diagonal;
    SolveTransfer(MakeStats(0.0f, 0.0f, {20.0f, -5.0f, -5.0f, 20.0f}), style, negative, VoraParameters());
    SolveTransfer(MakeStats(0.0f, 0.0f, {20.0f, 0.0f, 0.0f, 20.0f}), style, diagonal, VoraParameters());
    for (int i = 0; i < 4; ++i) EXPECT_EQ(negative.chromaMatrix[i], diagonal.chromaMatrix[i]) << i;
    // And with an isotropic content the map is the style root over 20.
    ExpectMatrix(diagonal, 25.0 / 20, 6.0 / 20, 6.0 / 20, 18.0 / 20, 1e-5);
}

TEST(SolveTransfer, SingularFloorGivesAZeroMap) {
    // solveFactor 0 leaves a grey content's Sc at zero: the LU inverse is
    // zero, and so is the map.
    VoraParameters params;
    params.solveFactor = 0.0f;
    TRANSFER t;
    SolveTransfer(MakeStats(0.0f, 0.0f, {0.0f, 0.0f, 0.0f, 0.0f}), MakeStats(1.0f, 1.0f, {9.0f, 1.0f, 1.0f, 4.0f}),
                  t, params);
    for (float v : t.chromaMatrix) EXPECT_EQ(v, 0.0f);
}

TEST(FitToneCurve, CoarseGridIsSevenByEightWithoutNominalEnds) {
    const std::vector<ToneGridPoint> grid = ToneCoarseGrid();
    ASSERT_EQ(grid.size(), 56u);
    std::set<float> centres;
    std::set<float> widths;
    for (size_t k = 0; k < grid.size(); ++k) {
        centres.insert(grid[k].centre);
        widths.insert(grid[k].width);
        // a-major order: the width runs fastest.
        EXPECT_EQ(grid[k].centre, grid[k - k % 8].centre) << k;
    }
    ASSERT_EQ(centres.size(), 7u);
    ASSERT_EQ(widths.size(), 8u);
    EXPECT_EQ(*centres.begin(), 0.0f);
    EXPECT_NEAR(*centres.rbegin(), 0.6f, 1e-6);
    EXPECT_EQ(*widths.begin(), 0.2f);
    EXPECT_NEAR(*widths.rbegin(), 0.9f, 1e-6);
}

TEST(FitToneCurve, TargetsLimitTheLargestMoveToPointTwo) {
    ColourStats content = MakeStats(0, 0, {0, 0, 0, 0});
    ColourStats style = content;
    for (int i = 0; i < 32; ++i) style.lightness[i] = content.lightness[i] * 0.5f;  // largest move 0.5 at i = 31
    float targets[32];

    VoraParameters params;  // threshold 0.2: pulled 0.2 at the largest point, proportionally elsewhere
    ToneTargets(content, style, params, targets);
    EXPECT_NEAR(content.lightness[31] - targets[31], 0.2f, 1e-6);
    for (int i = 0; i < 32; ++i) {
        EXPECT_NEAR(targets[i], content.lightness[i] * (1.0 - 0.2), 1e-6) << i;
    }

    params.limitFactor = 3.0f;  // threshold 0.6: the style is targeted directly
    ToneTargets(content, style, params, targets);
    for (int i = 0; i < 32; ++i) EXPECT_EQ(targets[i], style.lightness[i]) << i;

    // The limited move is 0.2 whatever limitFactor is, even when that is more
    // than the style asks for.
    for (int i = 0; i < 32; ++i) style.lightness[i] = content.lightness[i] + 0.15f * (i % 2 ? 1.0f : -1.0f);
    params.limitFactor = 0.5f;  // threshold 0.1 < 0.15
    ToneTargets(content, style, params, targets);
    for (int i = 0; i < 32; ++i) EXPECT_NEAR(std::fabs(targets[i] - content.lightness[i]), 0.2, 1e-6) << i;
}

TEST(FitToneCurve, RecoversAnArctanCurve) {
    ColourStats content = MakeStats(0, 0, {0, 0, 0, 0});
    ColourStats style = content;
    for (int i = 0; i < 32; ++i) style.lightness[i] = static_cast<float>(Arctan(content.lightness[i], 0.4, 0.3));
    VoraParameters params;
    params.limitFactor = 10.0f;  // target the style directly
    TRANSFER t;
    EXPECT_EQ(FitToneCurve(content, style, t, params), 0);

    EXPECT_EQ(t.toneCurve[0], 0.0f);
    EXPECT_EQ(t.toneCurve[255], 1.0f);
    EXPECT_EQ(t.toneCurve[256], 1.0f);
    for (int i = 1; i < 255; ++i) {
        EXPECT_NEAR(t.toneCurve[i], Arctan(i / 255.0, 0.4, 0.3), 2e-3) << i;
        EXPECT_GE(t.toneCurve[i], t.toneCurve[i - 1]) << i;
    }
}

TEST(FitToneCurve, NaNSamplesLeaveAClampedCurve) {
    // Every error is NaN, so no pair ever wins: (a, w) stays (0, 0), the curve
    // divides by zero and the clamp maps its NaNs to 0. Ends stay fixed.
    ColourStats content = MakeStats(0, 0, {0, 0, 0, 0});
    std::fill(std::begin(content.lightness), std::end(content.lightness), std::numeric_limits<float>::quiet_NaN());
    TRANSFER t;
    std::fill(std::begin(t.toneCurve), std::end(t.toneCurve), -1.0f);
    FitToneCurve(content, MakeStats(0, 0, {0, 0, 0, 0}), t, VoraParameters());
    EXPECT_EQ(t.toneCurve[0], 0.0f);
    for (int i = 1; i < 255; ++i) ASSERT_EQ(t.toneCurve[i], 0.0f) << i;
    EXPECT_EQ(t.toneCurve[255], 1.0f);
    EXPECT_EQ(t.toneCurve[256], 1.0f);
}

}  // namespace
}  // namespace vora
