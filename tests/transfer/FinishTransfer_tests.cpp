#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
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

TRANSFER IdentityTransfer() {
    TRANSFER t;
    t.chromaMatrix[0] = t.chromaMatrix[3] = t.lightnessHigh = 1.0f;
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

// The corrections FinishTransfer leaves for these faces on the ramp.
std::vector<FaceCorrection> Corrections(const std::vector<CFaceRect>& faces, TRANSFER t = IdentityTransfer(),
                                        float finishFactor = 1.0f) {
    VoraParameters params;
    params.faceRects = faces.data();
    params.numFaceRects = static_cast<uint32_t>(faces.size());
    params.finishFactor = finishFactor;
    t.faceCorrections.resize(3);  // stale entries must go
    EXPECT_EQ(FinishTransfer(Ramp(), params, t), 0);
    return t.faceCorrections;
}

TEST(FinishTransfer, MeasuresFacesWithASideOfTenAfterTheTransfer) {
    TRANSFER t = IdentityTransfer();
    t.styleMean[0] = 5.0f;
    t.styleMean[1] = -7.0f;
    // 9 x 9 is skipped, 10 x 3 and 3 x 10 are measured, 0 x 12 has no median and is skipped.
    const auto found = Corrections({FaceForSample(10, 10, 9, 9), FaceForSample(40, 20, 10, 3),
                                    FaceForSample(100, 10, 3, 10), FaceForSample(150, 10, 0, 12)}, t);
    ASSERT_EQ(found.size(), 2u);
    // Row 15 of 30 sorted pixels: column 45 for L, 44 for b (descending), row 21 for a; 0.09 is under the floor.
    const float expected[8] = {45.5f / 200, 0.22f, 0.025f, 0.015f, 0.045f, 21 + 5, -44 - 7, 0.5f};
    float got[8];
    std::memcpy(got, &found[0], sizeof got);
    for (int i = 0; i < 8; ++i) EXPECT_NEAR(got[i], expected[i], 1e-6) << i;
    EXPECT_NEAR(found[1].measuredL, 0.101f, 1e-6);
}

TEST(FinishTransfer, CorrectsOnlyFacesBelowTheTarget) {
    // Column 0 has lightness 0, which reads toneCurve[0] alone: a flat curve of v measures exactly v.
    struct Case {
        float curve, finishFactor, exponent;  // exponent 0: no entry
    };
    for (const Case c : {Case{0.5f, 1, 0}, Case{0.4f, 0.8f, 0}, Case{0.4f, 1, 0.8f}, Case{0.1f, 1, 0.5f},
                         Case{0.9f, 2, 0.9f}}) {
        TRANSFER t = IdentityTransfer();
        std::fill(std::begin(t.toneCurve), std::end(t.toneCurve), c.curve);
        const auto found = Corrections({FaceForSample(0, 10, 1, 20)}, t, c.finishFactor);
        ASSERT_EQ(found.size(), c.exponent > 0 ? 1u : 0u) << c.curve << " " << c.finishFactor;
        EXPECT_EQ(found.empty() ? 0.0f : found[0].exponent, c.exponent) << c.curve;
    }
}

TEST(FinishTransfer, NoUsableFaceListClearsCorrections) {
    EXPECT_TRUE(Corrections({}).empty());
    const std::vector<CFaceRect> faces = {FaceForSample(5, 5, 20, 20)};
    VoraParameters nullWithCount, negativeCount;
    nullWithCount.numFaceRects = 4;  // never dereferenced
    negativeCount.faceRects = faces.data();
    negativeCount.numFaceRects = 0x80000000u;
    for (const VoraParameters& params : {nullWithCount, negativeCount}) {
        TRANSFER t = IdentityTransfer();
        t.faceCorrections.resize(3);
        EXPECT_EQ(FinishTransfer(Ramp(), params, t), 0);
        EXPECT_TRUE(t.faceCorrections.empty());
    }
    EXPECT_THROW(Corrections({CFaceRect(0.8, 1.6, 0.2, 0.6)}), cv::Exception);  // sample outside the image
}

TEST(ApplyTransferToLab, AgreesWithThePerPixelTransfer) {
    cv::Mat big(40, 30, CV_32FC3), result;
    cv::randu(big, cv::Scalar(-0.05, -60, -60), cv::Scalar(1.05, 60, 60));
    const cv::Mat sample = big(cv::Rect(3, 2, 23, 37)), before = sample.clone();  // a view, odd sizes
    // Means, a symmetric map (as the solve makes them) and the lightness range; the curve follows.
    TRANSFER t{0, 0, {3, -4}, {-6, 2.5f}, {0.9f, 0.35f, 0.35f, 1.2f}, {}, 0.1f, 0.85f, {}};
    for (int i = 0; i < 257; ++i) t.toneCurve[i] = std::pow(std::min(i, 255) / 255.0f, 0.8f);
    ApplyTransferToLab(sample, t, result);
    EXPECT_EQ(cv::norm(sample, before, cv::NORM_INF), 0.0);
    ASSERT_TRUE(result.type() == CV_32FC3 && result.size() == sample.size());
    for (int i = 0; i < sample.rows * sample.cols; ++i) {
        const cv::Point p(i % sample.cols, i / sample.cols);
        const cv::Vec3f in = sample.at<cv::Vec3f>(p), out = result.at<cv::Vec3f>(p);
        const ChromaPixel chroma = MapChroma(t.contentMean, t.chromaMatrix, t.styleMean, in[1], in[2]);
        // Only the last bits may differ: OpenCV's arithmetic rounds differently.
        ASSERT_NEAR(out[0], ToneCurveLookup(t.toneCurve, NormaliseLightness(in[0], 0.1f, 0.85f)), 1e-5) << i;
        ASSERT_NEAR(out[1], chroma.a, 1e-4) << i;
        ASSERT_NEAR(out[2], chroma.b, 1e-4) << i;
    }
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
    cv::Mat sample(13, 11, CV_32FC3), result;
    cv::randu(sample, cv::Scalar(0, -20, -20), cv::Scalar(1, 20, 20));
    sample.at<cv::Vec3f>(0, 0)[0] = sample.at<cv::Vec3f>(12, 10)[0] = 0.4f;
    ApplyTransferToLab(sample, t, result);
    cv::Mat l;
    cv::extractChannel(result, l, 0);
    EXPECT_EQ(cv::countNonZero((l == 0) | (l == 1)), static_cast<int>(l.total()));  // a NaN equals neither
}

}  // namespace
}  // namespace vora
