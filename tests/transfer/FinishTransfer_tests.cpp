#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <vector>

#include "color/PixelTransfer.h"
#include "transfer/FinishTransfer.h"

namespace vora {
namespace {

TRANSFER IdentityTransfer() {
    TRANSFER t;
    for (int i = 0; i < 256; ++i) t.toneCurve[i] = static_cast<float>(i / 255.0);
    t.toneCurve[256] = 1.0f;
    t.lightnessLow = 0.0f;
    t.lightnessHigh = 1.0f;
    t.chromaMatrix[0] = 1.0f;
    t.chromaMatrix[3] = 1.0f;
    return t;
}

// A face whose sample rectangle is columns [x0, x0 + w) and rows [y0, y0 + h)
// of a columns x rows image. The sample bounds fall on pixel centres, so the
// truncation cannot tip either way.
CFaceRect FaceForSample(int columns, int rows, int x0, int y0, int w, int h) {
    const double halfX = w / (2.0 * columns);
    const double centreX = (x0 + 0.5) / columns + halfX;
    const double halfY = h / (2.0 * rows);
    const double centreY = (y0 + 0.5) / rows + halfY;
    const double faceWidth = halfX / 0.28;
    const double faceHeight = halfY / 0.28;
    const double middleY = centreY - faceHeight * 0.125;
    return CFaceRect(centreX - faceWidth / 2, centreX + faceWidth / 2, middleY - faceHeight / 2,
                     middleY + faceHeight / 2);
}

// L = column / 1000, a = row, b = -column.
cv::Mat RampLab(int columns, int rows) {
    cv::Mat lab(rows, columns, CV_32FC3);
    for (int r = 0; r < rows; ++r) {
        for (int c = 0; c < columns; ++c) {
            lab.at<cv::Vec3f>(r, c) = cv::Vec3f(c / 1000.0f, static_cast<float>(r), -static_cast<float>(c));
        }
    }
    return lab;
}

VoraParameters WithFaces(const std::vector<CFaceRect>& faces) {
    VoraParameters params;
    params.faceRects = faces.data();
    params.numFaceRects = static_cast<uint32_t>(faces.size());
    return params;
}

TEST(FinishTransfer, MeasuresTheMedianAfterTheTransfer) {
    const cv::Mat lab = RampLab(200, 100);
    TRANSFER t = IdentityTransfer();
    t.styleMean[0] = 5.0f;
    t.styleMean[1] = -7.0f;
    const std::vector<CFaceRect> faces = {FaceForSample(200, 100, 40, 20, 10, 3)};
    EXPECT_EQ(FinishTransfer(lab, WithFaces(faces), t), 0);

    ASSERT_EQ(t.faceCorrections.size(), 1u);
    const FaceCorrection& e = t.faceCorrections[0];
    const CFaceRect& f = faces[0];
    EXPECT_EQ(e.centreX, static_cast<float>((f.left + f.right) * 0.5));
    EXPECT_EQ(e.centreY, static_cast<float>((f.top + f.bottom) * 0.5 + (f.bottom - f.top) * 0.125));
    EXPECT_EQ(e.halfSizeX, static_cast<float>((f.right - f.left) * 0.28));
    EXPECT_EQ(e.halfSizeY, static_cast<float>((f.bottom - f.top) * 0.28));
    // 30 pixels, row 15 of each sorted column (the upper middle): three rows
    // per column, ten columns per row. L ascends with the column (column 45),
    // b descends (column 44), a ascends with the row (row 21).
    EXPECT_NEAR(e.measuredL, 0.045f, 1e-6);
    EXPECT_EQ(e.measuredA, 21.0f + 5.0f);
    EXPECT_EQ(e.measuredB, -44.0f - 7.0f);
    EXPECT_EQ(e.exponent, 0.5f);  // 0.09 is below the floor
}

TEST(FinishTransfer, SamplesWhenEitherSideReachesTen) {
    const cv::Mat lab = RampLab(200, 100);
    TRANSFER t = IdentityTransfer();
    const std::vector<CFaceRect> faces = {
        FaceForSample(200, 100, 10, 10, 9, 9),    // skipped
        FaceForSample(200, 100, 50, 10, 10, 3),   // measured
        FaceForSample(200, 100, 100, 10, 3, 10),  // measured
        FaceForSample(200, 100, 150, 10, 0, 12),  // empty sample: skipped
    };
    FinishTransfer(lab, WithFaces(faces), t);
    ASSERT_EQ(t.faceCorrections.size(), 2u);
    EXPECT_NEAR(t.faceCorrections[0].measuredL, 0.055f, 1e-6);
    EXPECT_NEAR(t.faceCorrections[1].measuredL, 0.101f, 1e-6);
    EXPECT_EQ(t.faceCorrections[0].centreX, static_cast<float>((faces[1].left + faces[1].right) * 0.5));
}

TEST(FinishTransfer, CorrectsOnlyFacesBelowTheTarget) {
    // Lightness 0 maps to t = 0 and reads toneCurve[0] with weight 1, so a
    // flat curve of v measures exactly v.
    const cv::Mat lab(50, 50, CV_32FC3, cv::Scalar(0, 0, 0));
    const std::vector<CFaceRect> faces = {FaceForSample(50, 50, 10, 10, 20, 20)};
    struct Case {
        float curve;
        float finishFactor;
        bool corrected;
        float exponent;
    };
    for (const Case c : {Case{0.5f, 1.0f, false, 0.0f}, Case{0.4f, 1.0f, true, 0.8f}, Case{0.1f, 1.0f, true, 0.5f},
                         Case{0.4f, 0.8f, false, 0.0f}, Case{0.5f, 2.0f, true, 0.5f}, Case{0.9f, 2.0f, true, 0.9f}}) {
        TRANSFER t = IdentityTransfer();
        std::fill(std::begin(t.toneCurve), std::end(t.toneCurve), c.curve);
        VoraParameters params = WithFaces(faces);
        params.finishFactor = c.finishFactor;
        FinishTransfer(lab, params, t);
        ASSERT_EQ(t.faceCorrections.size(), c.corrected ? 1u : 0u) << c.curve << " " << c.finishFactor;
        if (c.corrected) {
            EXPECT_EQ(t.faceCorrections[0].measuredL, c.curve);
            EXPECT_EQ(t.faceCorrections[0].exponent, c.exponent) << c.curve << " " << c.finishFactor;
        }
    }
}

TEST(FinishTransfer, NoUsableFaceListClearsCorrections) {
    const cv::Mat lab = RampLab(40, 40);
    const std::vector<CFaceRect> faces = {FaceForSample(40, 40, 5, 5, 20, 20)};
    VoraParameters none;
    VoraParameters nullWithCount;
    nullWithCount.numFaceRects = 4;  // null pointer: read as no faces
    VoraParameters negativeCount = WithFaces(faces);
    negativeCount.numFaceRects = 0x80000000u;  // negative as a signed count
    for (const VoraParameters& params : {none, nullWithCount, negativeCount}) {
        TRANSFER t = IdentityTransfer();
        t.faceCorrections.resize(3);
        EXPECT_EQ(FinishTransfer(lab, params, t), 0);
        EXPECT_TRUE(t.faceCorrections.empty());
    }
}

TEST(FinishTransfer, SampleOutsideTheImageThrows) {
    const cv::Mat lab = RampLab(40, 40);
    const std::vector<CFaceRect> faces = {CFaceRect(0.8, 1.6, 0.2, 0.6)};
    TRANSFER t = IdentityTransfer();
    EXPECT_THROW(FinishTransfer(lab, WithFaces(faces), t), cv::Exception);
}

TEST(ApplyTransferToLab, AgreesWithThePerPixelTransferForASymmetricMap) {
    cv::RNG rng(5);
    cv::Mat big(40, 30, CV_32FC3);
    rng.fill(big, cv::RNG::UNIFORM, cv::Scalar(-0.05, -60, -60), cv::Scalar(1.05, 60, 60));
    const cv::Mat sample = big(cv::Rect(3, 2, 23, 37));  // a view, odd sizes
    const cv::Mat before = sample.clone();

    TRANSFER t;
    for (int i = 0; i < 256; ++i) t.toneCurve[i] = static_cast<float>(std::pow(i / 255.0, 0.8));
    t.toneCurve[256] = 1.0f;
    t.lightnessLow = 0.1f;
    t.lightnessHigh = 0.85f;
    t.contentMean[0] = 3.0f;
    t.contentMean[1] = -4.0f;
    t.styleMean[0] = -6.0f;
    t.styleMean[1] = 2.5f;
    const float m[4] = {0.9f, 0.35f, 0.35f, 1.2f};
    std::copy(m, m + 4, t.chromaMatrix);

    cv::Mat result;
    ApplyTransferToLab(sample, t, result);
    ASSERT_EQ(result.size(), sample.size());
    ASSERT_EQ(result.type(), CV_32FC3);
    EXPECT_EQ(cv::norm(sample, before, cv::NORM_INF), 0.0);

    for (int r = 0; r < sample.rows; ++r) {
        for (int c = 0; c < sample.cols; ++c) {
            const cv::Vec3f in = sample.at<cv::Vec3f>(r, c);
            const cv::Vec3f out = result.at<cv::Vec3f>(r, c);
            const float lightness =
                ToneCurveLookup(t.toneCurve, NormaliseLightness(in[0], t.lightnessLow, t.lightnessHigh));
            const float d0 = in[1] - t.contentMean[0];
            const float d1 = in[2] - t.contentMean[1];
            // Only the last bits may differ: OpenCV's arithmetic rounds differently.
            ASSERT_NEAR(out[0], lightness, 1e-5) << r << "," << c;
            ASSERT_NEAR(out[1], m[0] * d0 + m[1] * d1 + t.styleMean[0], 1e-4) << r << "," << c;
            ASSERT_NEAR(out[2], m[2] * d0 + m[3] * d1 + t.styleMean[1], 1e-4) << r << "," << c;
        }
    }
}

TEST(ApplyTransferToLab, ChromaMapMultipliesFromTheRight) {
    // Rows (a, b) times the matrix: (a T00 + b T10, a T01 + b T11).
    TRANSFER t = IdentityTransfer();
    const float m[4] = {1.0f, 2.0f, 0.0f, 1.0f};
    std::copy(m, m + 4, t.chromaMatrix);
    const cv::Mat sample(1, 1, CV_32FC3, cv::Scalar(0.5, 1.0, 1.0));
    cv::Mat result;
    ApplyTransferToLab(sample, t, result);
    EXPECT_EQ(result.at<cv::Vec3f>(0, 0)[1], 1.0f);
    EXPECT_EQ(result.at<cv::Vec3f>(0, 0)[2], 3.0f);
}

TEST(ApplyTransferToLab, ZeroSpreadReadsOnlyTheCurveEnds) {
    // Unguarded 0/0: the NaNs end at one end of the curve or the other
    // (OpenCV's vectorised max makes some of them 0), never outside it.
    TRANSFER t = IdentityTransfer();
    t.lightnessLow = 0.4f;
    t.lightnessHigh = 0.4f;
    cv::Mat sample(13, 11, CV_32FC3);
    cv::randu(sample, cv::Scalar(0, -20, -20), cv::Scalar(1, 20, 20));
    cv::Mat result;
    ApplyTransferToLab(sample, t, result);
    for (auto it = result.begin<cv::Vec3f>(); it != result.end<cv::Vec3f>(); ++it) {
        const float l = (*it)[0];
        ASSERT_TRUE(l == t.toneCurve[0] || l == t.toneCurve[255]) << l;
    }
}

}  // namespace
}  // namespace vora
