#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>

#include "transfer/SolveTransfer.h"

namespace vora {
namespace {

// Lightness samples on a straight line, this chroma root, everything else zero.
ColourStats MakeStats(std::array<float, 4> sqrtCov) {
    ColourStats stats{};
    std::copy(sqrtCov.begin(), sqrtCov.end(), stats.chromaSqrtCov);
    for (int i = 0; i < 32; ++i) stats.lightness[i] = i / 31.0f;
    return stats;
}

const ColourStats kGrey = MakeStats({0, 0, 0, 0});

// The chroma map solved from these statistics.
cv::Matx22f Map(const ColourStats& content, const ColourStats& style, float solveFactor = 1.0f) {
    VoraParameters params;
    params.solveFactor = solveFactor;
    TRANSFER t;
    SolveTransfer(content, style, t, params);
    return cv::Matx22f(t.chromaMatrix);
}

TEST(SolveTransfer, EqualStatisticsGiveTheIdentityMap) {
    // Diagonal above the floor of 15, positive off-diagonal: the floor changes nothing.
    ColourStats content = MakeStats({30, 4, 4, 20}), style = content;
    content.chromaMean[0] = 3.5f;
    content.lightnessLow = 0.12f;
    content.lightnessHigh = 0.87f;
    style.chromaMean[1] = 2.0f;  // the means do not enter the map; the style's percentile points are 0
    TRANSFER t;
    SolveTransfer(content, style, t, VoraParameters());
    EXPECT_LE(cv::norm(cv::Matx22f(t.chromaMatrix) - cv::Matx22f::eye(), cv::NORM_INF), 1e-5);
    EXPECT_EQ(cv::Vec4f(t.contentMean[0], t.contentMean[1], t.styleMean[0], t.styleMean[1]),
              cv::Vec4f(3.5f, 0, 0, 2.0f));
    EXPECT_EQ(cv::Vec2f(t.lightnessLow, t.lightnessHigh), cv::Vec2f(0.12f, 0.87f));
}

TEST(SolveTransfer, FloorActsOnEveryEntry) {
    // A grey content gives the style root over solveFactor x 15; solveFactor 0 leaves Sc singular,
    // whose LU inverse, and so the map, is zero.
    const ColourStats style = MakeStats({12, -3, -3, 7});
    for (float factor : {1.0f, 2.0f, 0.5f}) {
        EXPECT_LE(cv::norm(Map(kGrey, style, factor) - cv::Matx22f(style.chromaSqrtCov) / (15 * factor), cv::NORM_INF),
                  1e-5) << factor;
    }
    EXPECT_EQ(cv::norm(Map(kGrey, style, 0.0f), cv::NORM_INF), 0.0);
    // Element-wise max(Sc, R), not an eigenvalue floor: -5 becomes 0, Sc = 20 I.
    const cv::Matx22f floored = Map(MakeStats({20, -5, -5, 20}), MakeStats({25, 6, 6, 18}));
    EXPECT_LE(cv::norm(floored - cv::Matx22f(25, 6, 6, 18) * 0.05f, cv::NORM_INF), 1e-5);
}

TEST(FitToneCurve, TargetsLimitTheLargestMoveToPointTwo) {
    ColourStats style = kGrey;
    const float* c = kGrey.lightness;
    for (int i = 0; i < 32; ++i) style.lightness[i] = c[i] * 0.5f;  // largest move 0.5, at i = 31
    float targets[32];
    VoraParameters params;  // over the threshold of 0.2: moved 0.2 at the largest point, in proportion elsewhere
    ToneTargets(kGrey, style, params, targets);
    for (int i = 0; i < 32; ++i) EXPECT_NEAR(targets[i], c[i] * 0.8, 1e-6) << i;
    params.limitFactor = 3.0f;  // within 0.6: the style is the target
    ToneTargets(kGrey, style, params, targets);
    for (int i = 0; i < 32; ++i) EXPECT_EQ(targets[i], style.lightness[i]) << i;
    // Moves of 0.15 over a threshold of 0.1 are stretched to 0.2, not cut to 0.1.
    for (int i = 0; i < 32; ++i) style.lightness[i] = c[i] + (i % 2 ? 0.15f : -0.15f);
    params.limitFactor = 0.5f;
    ToneTargets(kGrey, style, params, targets);
    for (int i = 0; i < 32; ++i) EXPECT_NEAR(std::fabs(targets[i] - c[i]), 0.2, 1e-6) << i;
}

TEST(FitToneCurve, RecoversAnArctanCurveAndClampsNaN) {
    const auto f = [](double x) { return std::atan((x - 0.46) / 0.34); };  // a = 0.46, w = 0.34: fine grid only
    const auto arctan = [&f](double x) { return (f(x) - f(0)) / (f(1) - f(0)); };
    ColourStats style = kGrey;
    for (int i = 0; i < 32; ++i) style.lightness[i] = static_cast<float>(arctan(kGrey.lightness[i]));
    VoraParameters params;
    params.limitFactor = 10.0f;  // target the style directly
    TRANSFER t;
    FitToneCurve(kGrey, style, t, params);
    for (int i = 0; i < 257; ++i) EXPECT_NEAR(t.toneCurve[i], arctan(std::min(i, 255) / 255.0), 1e-5) << i;

    // Every error NaN: (a, w) stays (0, 0), the curve is 0/0, the clamp makes it 0; the ends stay.
    ColourStats nan = kGrey;
    std::fill(std::begin(nan.lightness), std::end(nan.lightness), std::numeric_limits<float>::quiet_NaN());
    std::fill(std::begin(t.toneCurve), std::end(t.toneCurve), -1.0f);
    FitToneCurve(nan, kGrey, t, VoraParameters());
    for (int i = 0; i < 257; ++i) ASSERT_EQ(t.toneCurve[i], i < 255 ? 0.0f : 1.0f) << i;
}

}  // namespace
}  // namespace vora
