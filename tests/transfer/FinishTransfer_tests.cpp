#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <vector>

#include "color/PixelTransfer.h"
#include "transfer/FinishTransfer.h"

namespace vora {
namespace {

// 200 x 100 pixels, L = column / 1000, a = row, b = -column.
cv::Mat Ramp() {
    cv::Mat lab(100, 200, CV_32FC3);
    lab.forEach<cv::Vec3f>([](cv::Vec3f& p, const int* rc) { p = cv::Vec3f(rc[1] / 1000.0f, rc[0], -rc[1]); });
    return lab;
}

// The identity map and curve about these style means.
TRANSFER IdentityTransfer(float styleA = 0.0f, float styleB = 0.0f) {
    TRANSFER t{0, 0, {}, {styleA, styleB}, {1, 0, 0, 1}, {}, 0.0f, 1.0f, {}};
    for (int i = 0; i < 257; ++i) t.toneCurve[i] = std::min(1.0f, i / 255.0f);
    return t;
}

// A face whose sample is columns [x0, x0 + w) and rows [y0, y0 + h) of the ramp. The sample
// bounds fall on pixel centres, so the truncation cannot tip either way.
CFaceRect FaceForSample(int x0, int y0, int w, int h) {
    const double centreX = (x0 + 0.5 + w / 2.0) / 200, halfWidth = w / 224.0, halfHeight = h / 112.0;
    const double middleY = (y0 + 0.5 + h / 2.0) / 100 - halfHeight / 4;
    return CFaceRect(centreX - halfWidth, centreX + halfWidth, middleY - halfHeight, middleY + halfHeight);
}

// The corrections FinishTransfer leaves for these faces on the ramp; `count` overrides the list's size.
std::vector<FaceCorrection> Corrections(const std::vector<CFaceRect>& faces, TRANSFER t = IdentityTransfer(),
                                        float finishFactor = 1.0f, int64_t count = -1) {
    VoraParameters params;
    params.faceRects = faces.empty() ? nullptr : faces.data();
    params.numFaceRects = static_cast<uint32_t>(count < 0 ? faces.size() : count);
    params.finishFactor = finishFactor;
    t.faceCorrections.resize(3);  // stale entries must go
    EXPECT_EQ(FinishTransfer(Ramp(), params, t), 0);
    return t.faceCorrections;
}

TEST(FinishTransfer, MeasuresFacesWithASideOfTenAfterTheTransfer) {
    // 9 x 9 is skipped, 10 x 3 and 3 x 10 are measured, 0 x 12 has no median and is skipped.
    const auto found = Corrections({FaceForSample(10, 10, 9, 9), FaceForSample(40, 20, 10, 3),
                                    FaceForSample(100, 10, 3, 10), FaceForSample(150, 10, 0, 12)},
                                   IdentityTransfer(5.0f, -7.0f));
    ASSERT_EQ(found.size(), 2u);
    // Row 15 of 30 sorted pixels: column 45 for L, 44 for b (descending), row 21 for a; 0.09 is under the floor.
    const float expected[8] = {45.5f / 200, 0.22f, 0.025f, 0.015f, 0.045f, 21 + 5, -44 - 7, 0.5f};
    const float* got = reinterpret_cast<const float*>(found.data());  // eight floats, as the record's layout asserts
    for (int i = 0; i < 8; ++i) EXPECT_NEAR(got[i], expected[i], 1e-6) << i;
    EXPECT_NEAR(found[1].measuredL, 0.101f, 1e-6);
}

TEST(FinishTransfer, CorrectsOnlyFacesBelowTheTarget) {
    // Column 0 has lightness 0, which reads toneCurve[0] alone: a flat curve of v measures exactly v.
    // The curve's value, finishFactor and the exponent (0: no entry; an entry's exponent is at least 0.5).
    for (const auto& c : {std::array<float, 3>{0.5f, 1, 0}, {0.4f, 0.8f, 0}, {0.4f, 1, 0.8f}, {0.1f, 1, 0.5f},
                          {0.9f, 2, 0.9f}}) {
        TRANSFER t = IdentityTransfer();
        std::fill(std::begin(t.toneCurve), std::end(t.toneCurve), c[0]);
        const auto found = Corrections({FaceForSample(0, 10, 1, 20)}, t, c[1]);
        EXPECT_EQ(found.empty() ? 0.0f : found[0].exponent, c[2]) << c[0] << " " << c[1];
    }
}

TEST(FinishTransfer, NoUsableFaceListClearsCorrections) {
    EXPECT_TRUE(Corrections({}).empty());
    EXPECT_TRUE(Corrections({}, IdentityTransfer(), 1.0f, 4).empty());  // a null list is never dereferenced
    EXPECT_TRUE(Corrections({FaceForSample(5, 5, 20, 20)}, IdentityTransfer(), 1.0f, 0x80000000u).empty());  // < 0
    EXPECT_THROW(Corrections({CFaceRect(0.8, 1.6, 0.2, 0.6)}), cv::Exception);  // sample outside the image
}

TEST(ApplyTransferToLab, AgreesWithThePerPixelTransfer) {
    cv::Mat big(40, 30, CV_32FC3), result;
    cv::randu(big, cv::Scalar(-0.05, -60, -60), cv::Scalar(1.05, 60, 60));
    const cv::Mat sample = big(cv::Rect(3, 2, 23, 37));  // a view, odd sizes
    cv::Mat expected = sample.clone();
    // Means, a symmetric map (as the solve makes them) and the lightness range; the curve follows.
    TRANSFER t{0, 0, {3, -4}, {-6, 2.5f}, {0.9f, 0.35f, 0.35f, 1.2f}, {}, 0.1f, 0.85f, {}};
    for (int i = 0; i < 257; ++i) t.toneCurve[i] = std::pow(std::min(i, 255) / 255.0f, 0.8f);
    ApplyTransferToLab(sample, t, result);
    EXPECT_EQ(cv::norm(sample, expected, cv::NORM_INF), 0.0);  // the input stays
    expected.forEach<cv::Vec3f>([&t](cv::Vec3f& p, const int*) {
        const ChromaPixel chroma = MapChroma(t.contentMean, t.chromaMatrix, t.styleMean, p[1], p[2]);
        p = cv::Vec3f(ToneCurveLookup(t.toneCurve, NormaliseLightness(p[0], 0.1f, 0.85f)), chroma.a, chroma.b);
    });
    EXPECT_LE(cv::norm(result, expected, cv::NORM_INF), 1e-4);  // OpenCV's arithmetic rounds differently
    // (a, b) is a row multiplied by the matrix from the right: (a T00 + b T10, a T01 + b T11).
    TRANSFER shear = IdentityTransfer();
    shear.chromaMatrix[1] = 2.0f;
    ApplyTransferToLab(cv::Mat(1, 1, CV_32FC3, cv::Scalar(0, 1, 1)), shear, result);
    EXPECT_EQ(result.at<cv::Vec3f>(0, 0), cv::Vec3f(0, 1, 3));
}

TEST(ApplyTransferToLab, ZeroSpreadReadsOnlyTheCurveEnds) {
    // Unguarded: +-inf, and NaN where L equals the point (first pixel vectorised, last in the scalar tail),
    // all end at one end of the curve or the other, never outside it.
    TRANSFER t = IdentityTransfer();
    t.lightnessLow = t.lightnessHigh = 0.4f;
    cv::Mat sample(13, 11, CV_32FC3), result, l;
    cv::randu(sample, cv::Scalar(0, -20, -20), cv::Scalar(1, 20, 20));
    sample.at<cv::Vec3f>(0, 0)[0] = sample.at<cv::Vec3f>(12, 10)[0] = 0.4f;
    ApplyTransferToLab(sample, t, result);
    cv::extractChannel(result, l, 0);
    EXPECT_EQ(cv::countNonZero((l == 0) | (l == 1)), static_cast<int>(l.total()));  // a NaN equals neither
}

}  // namespace
}  // namespace vora
