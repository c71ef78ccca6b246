#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <random>
#include <vector>

#include "color/ColorConversion.h"
#include "transfer/ColourStatistics.h"

namespace vora {
namespace {

cv::Mat LabOf(const cv::Mat& bgr8) {
    cv::Mat lab(bgr8.size(), CV_32FC3);
    ConvertToLab(bgr8, lab);
    return lab;
}

ColourStats StatsOf(const cv::Mat& lab) {
    ColourStats stats{};
    EXPECT_EQ(ComputeChromaStats(lab, stats), 0);
    EXPECT_EQ(ComputeLightnessStats(lab, stats), 0);
    return stats;
}

// A working Lab image with the given lightness values (in this order) and zero chroma.
cv::Mat LabWithLightness(const std::vector<float>& lightness, int rows) {
    const int columns = static_cast<int>(lightness.size()) / rows;
    cv::Mat lab(rows, columns, CV_32FC3, cv::Scalar(0, 0, 0));
    for (size_t i = 0; i < lightness.size(); ++i) {
        lab.at<cv::Vec3f>(static_cast<int>(i) / columns, static_cast<int>(i) % columns)[0] = lightness[i];
    }
    return lab;
}

TEST(ConvertToLab, WhiteAndBlackAreExact) {
    cv::Mat bgr(1, 2, CV_8UC3);
    bgr.at<cv::Vec3b>(0, 0) = cv::Vec3b(255, 255, 255);
    bgr.at<cv::Vec3b>(0, 1) = cv::Vec3b(0, 0, 0);
    const cv::Mat lab = LabOf(bgr);

    const cv::Vec3f white = lab.at<cv::Vec3f>(0, 0);
    EXPECT_EQ(white[0], 1.0f);
    EXPECT_EQ(white[1], 0.0f);
    EXPECT_EQ(white[2], 0.0f);
    const cv::Vec3f black = lab.at<cv::Vec3f>(0, 1);
    EXPECT_NEAR(black[0], 0.0f, 1e-9);
    EXPECT_EQ(black[1], 0.0f);
    EXPECT_EQ(black[2], 0.0f);
}

TEST(ConvertToLab, ReadsBlueGreenRedThroughTheRowStride) {
    // A view into a wider image, so rows lie further apart than width x 3 bytes.
    cv::Mat wide(7, 11, CV_8UC3);
    cv::randu(wide, cv::Scalar::all(0), cv::Scalar::all(256));
    const cv::Mat view = wide(cv::Rect(3, 2, 5, 4));
    ASSERT_FALSE(view.isContinuous());
    const cv::Mat lab = LabOf(view);

    for (int r = 0; r < view.rows; ++r) {
        for (int c = 0; c < view.cols; ++c) {
            const cv::Vec3b bgr = view.at<cv::Vec3b>(r, c);
            const LabPixel expected = RgbToLab(bgr[2], bgr[1], bgr[0]);
            const cv::Vec3f got = lab.at<cv::Vec3f>(r, c);
            ASSERT_EQ(got[0], expected.lightness01) << r << "," << c;
            ASSERT_EQ(got[1], expected.a) << r << "," << c;
            ASSERT_EQ(got[2], expected.b) << r << "," << c;
        }
    }
    // A pure red pixel has positive a*: catches a swapped byte order.
    cv::Mat red(1, 1, CV_8UC3, cv::Scalar(0, 0, 255));
    EXPECT_GT(LabOf(red).at<cv::Vec3f>(0, 0)[1], 50.0f);
}

TEST(ColourStatistics, FlatImagesStayInsideTheArray) {
    // One pixel and a uniform grey: the normalisation is 0/0 everywhere, every
    // value becomes 0 and the first sample index would be N; it is clamped.
    for (const cv::Size size : {cv::Size(1, 1), cv::Size(40, 30)}) {
        const cv::Mat bgr(size, CV_8UC3, cv::Scalar(90, 120, 150));
        const cv::Mat lab = LabOf(bgr);
        const cv::Vec3f pixel = lab.at<cv::Vec3f>(0, 0);
        const ColourStats stats = StatsOf(lab);

        EXPECT_EQ(stats.lightnessLow, pixel[0]);
        EXPECT_EQ(stats.lightnessHigh, pixel[0]);
        for (float v : stats.lightness) EXPECT_EQ(v, 0.0f);
        // One pixel: exact. More: OpenCV sums the mean in float, so the mean
        // is a few units in the last place off and the spread not quite zero.
        const double tolerance = size.area() == 1 ? 0.0 : 1e-3;
        EXPECT_NEAR(stats.chromaMean[0], pixel[1], tolerance);
        EXPECT_NEAR(stats.chromaMean[1], pixel[2], tolerance);
        for (float v : stats.chromaSqrtCov) EXPECT_NEAR(v, 0.0f, tolerance);
    }
}

TEST(ColourStatistics, TwoLevelImageReadsAroundTheClippedBoundary) {
    // No value lies strictly inside (0, 1): Z = 50, M = -1, so samples 0..30
    // read s[50] = 1 and sample 31 reads s[49] = 0.
    std::vector<float> lightness(100, 0.2f);
    std::fill(lightness.begin() + 50, lightness.end(), 0.8f);
    std::shuffle(lightness.begin(), lightness.end(), std::mt19937(7));
    const ColourStats stats = StatsOf(LabWithLightness(lightness, 10));

    EXPECT_EQ(stats.lightnessLow, 0.2f);
    EXPECT_EQ(stats.lightnessHigh, 0.8f);
    for (int i = 0; i < 31; ++i) EXPECT_EQ(stats.lightness[i], 1.0f) << i;
    EXPECT_EQ(stats.lightness[31], 0.0f);
}

TEST(ColourStatistics, PercentilesAndSamplesOfARamp) {
    // 1101 values k/1100, shuffled. Low index trunc(1100 x 0.005 + 0.5) = 6,
    // high index trunc(1100 x 0.995 + 0.5) = 1095. Values 0..6 normalise to
    // 0, 1095..1100 to 1, so the samples run over indices 7..1094.
    std::vector<float> lightness(1101);
    for (int k = 0; k < 1101; ++k) lightness[k] = static_cast<float>(k / 1100.0);
    std::vector<float> shuffled = lightness;
    std::shuffle(shuffled.begin(), shuffled.end(), std::mt19937(3));
    const ColourStats stats = StatsOf(LabWithLightness(shuffled, 3));

    EXPECT_EQ(stats.lightnessLow, lightness[6]);
    EXPECT_EQ(stats.lightnessHigh, lightness[1095]);
    const double low = lightness[6];
    const double spread = lightness[1095] - lightness[6];
    for (int i = 0; i < 32; ++i) {
        const int index = 7 + static_cast<int>(std::ceil(i / 31.0 * 1087.0));
        // Neighbouring values differ by about 1e-3, so this pins the index.
        EXPECT_NEAR(stats.lightness[i], (lightness[index] - low) / spread, 1e-6) << i;
    }
    EXPECT_NEAR(stats.lightness[0], (lightness[7] - low) / spread, 1e-6);
    EXPECT_NEAR(stats.lightness[31], (lightness[1094] - low) / spread, 1e-6);
}

TEST(ColourStatistics, ChromaCovarianceIsScaledByNAndSkipsLightness) {
    // (a, b) = (1, 2), (-1, -2), (1, -2), (-1, 2): covariance diag(1, 4) when
    // divided by N = 4; lightness varies and must not leak in.
    cv::Mat lab(2, 2, CV_32FC3);
    lab.at<cv::Vec3f>(0, 0) = cv::Vec3f(0.1f, 1.0f, 2.0f);
    lab.at<cv::Vec3f>(0, 1) = cv::Vec3f(0.9f, -1.0f, -2.0f);
    lab.at<cv::Vec3f>(1, 0) = cv::Vec3f(0.4f, 1.0f, -2.0f);
    lab.at<cv::Vec3f>(1, 1) = cv::Vec3f(0.7f, -1.0f, 2.0f);
    ColourStats stats{};
    ComputeChromaStats(lab, stats);
    EXPECT_EQ(stats.chromaMean[0], 0.0f);
    EXPECT_EQ(stats.chromaMean[1], 0.0f);
    EXPECT_NEAR(stats.chromaSqrtCov[0], 1.0f, 1e-6);
    EXPECT_NEAR(stats.chromaSqrtCov[1], 0.0f, 1e-6);
    EXPECT_NEAR(stats.chromaSqrtCov[2], 0.0f, 1e-6);
    EXPECT_NEAR(stats.chromaSqrtCov[3], 2.0f, 1e-6);
}

TEST(MatrixSqrt, SquaresBackToSymmetricPositiveInput) {
    cv::RNG rng(11);
    for (int trial = 0; trial < 20; ++trial) {
        cv::Mat m(2, 2, CV_32F);
        rng.fill(m, cv::RNG::UNIFORM, -30.0f, 30.0f);
        const cv::Mat spd = m * m.t() + cv::Mat::eye(2, 2, CV_32F);
        cv::Mat root;
        MatrixSqrt(spd, root);
        ASSERT_EQ(root.type(), CV_32F);
        EXPECT_NEAR(root.at<float>(0, 1), root.at<float>(1, 0), 1e-3);
        EXPECT_GT(cv::determinant(root), 0.0);  // the principal root
        const cv::Mat square = root * root;
        EXPECT_LE(cv::norm(square, spd, cv::NORM_INF), 1e-4 * cv::norm(spd, cv::NORM_INF)) << spd;
    }
    cv::Mat root;
    MatrixSqrt(cv::Mat::zeros(2, 2, CV_32F), root);
    EXPECT_EQ(cv::countNonZero(root), 0);
}

}  // namespace
}  // namespace vora
