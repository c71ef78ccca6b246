#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <filesystem>
#include <random>
#include <vector>

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include "support/TestImages.h"

#include "color/ColorConversion.h"
#include "transfer/ColourStatistics.h"

namespace vora {
namespace {

ColourStats StatsOf(const cv::Mat& lab) {
    ColourStats stats{};
    ComputeChromaStats(lab, stats);
    ComputeLightnessStats(lab, stats);
    return stats;
}

// An image of `rows` rows holding these lightness values, shuffled, with zero chroma.
ColourStats StatsOfLightness(std::vector<float> lightness, int rows) {
    std::shuffle(lightness.begin(), lightness.end(), std::mt19937(7));
    cv::Mat lab(rows, static_cast<int>(lightness.size()) / rows, CV_32FC3, cv::Scalar::all(0));
    cv::insertChannel(cv::Mat(lightness).reshape(1, rows), lab, 0);
    return StatsOf(lab);
}

TEST(ColourStatistics, FlatImagesStayInsideTheArray) {
    // 0/0 normalises every value to 0, and the first sample index would be N.
    for (const cv::Size size : {cv::Size(1, 1), cv::Size(40, 30)}) {
        const ColourStats s = StatsOf(cv::Mat(size, CV_32FC3, cv::Scalar(0.375, 12.5, -30)));
        EXPECT_EQ(cv::Vec4f(s.lightnessLow, s.lightnessHigh, s.chromaMean[0], s.chromaMean[1]),
                  cv::Vec4f(0.375f, 0.375f, 12.5f, -30.0f));
        for (float v : s.lightness) EXPECT_EQ(v, 0.0f);
        for (float v : s.chromaSqrtCov) EXPECT_NEAR(v, 0.0f, 1e-3);
    }
}

TEST(ColourStatistics, PercentilesAndSamples) {
    // Two levels, nothing strictly inside (0, 1): Z = 50, M = -1, so samples 0..30 read s[50] = 1
    // and sample 31 reads s[49] = 0.
    std::vector<float> levels(100, 0.2f);
    std::fill(levels.begin() + 50, levels.end(), 0.8f);
    const ColourStats two = StatsOfLightness(levels, 10);
    EXPECT_EQ(cv::Vec2f(two.lightnessLow, two.lightnessHigh), cv::Vec2f(0.2f, 0.8f));
    for (int i = 0; i < 32; ++i) EXPECT_EQ(two.lightness[i], i < 31 ? 1.0f : 0.0f) << i;

    // 300 values k/299: trunc(299 x 0.005 + 0.5) = 1 and trunc(299 x 0.995 + 0.5) = 298 (N in
    // place of N - 1 gives 2 and 299). 0..1 normalise to 0, 298..299 to 1: Z = 2, M = 295.
    std::vector<float> ramp(300);
    for (int k = 0; k < 300; ++k) ramp[k] = k / 299.0f;
    const ColourStats s = StatsOfLightness(ramp, 3);
    EXPECT_EQ(cv::Vec2f(s.lightnessLow, s.lightnessHigh), cv::Vec2f(ramp[1], ramp[298]));
    for (int i = 0; i < 32; ++i) {
        const int index = 2 + static_cast<int>(std::ceil(i / 31.0 * 295.0));  // neighbours are 3e-3 apart
        EXPECT_NEAR(s.lightness[i], (ramp[index] - ramp[1]) / (ramp[298] - ramp[1]), 1e-6) << i;
    }
}

TEST(ColourStatistics, ChromaCovarianceIsScaledByNAndSkipsLightness) {
    // (a, b) = (+-1, +-2): covariance diag(1, 4) when divided by N = 4, so the root is diag(1, 2).
    const cv::Mat lab = (cv::Mat_<float>(2, 6) << 0.1, 1, 2, 0.9, -1, -2, 0.4, 1, -2, 0.7, -1, 2);
    const ColourStats s = StatsOf(lab.reshape(3));
    for (int i = 0; i < 6; ++i) EXPECT_NEAR(s.data()[i], (i == 2) + 2 * (i == 5), 1e-6) << i;
}

// The histogram gives the sort's bits wherever it applies: photo-like, flat,
// single-pixel, two-level (nothing strictly inside) and noise images, and
// every 24-bit colour; lightness no conversion gives is left to the sort.
TEST(ColourStatistics, LightnessFromLevelsEqualsTheSortBitForBit) {
    cv::Mat noise(300, 401, CV_8UC3), twoLevels(20, 30, CV_8UC3, cv::Scalar::all(0));
    cv::randu(noise, cv::Scalar::all(0), cv::Scalar::all(256));
    twoLevels.rowRange(0, 7).setTo(cv::Scalar::all(255));
#if defined(__SANITIZE_ADDRESS__)
    const int allRows = 512;  // every 32nd row of the colour cube: the sort is slow under the sanitizers
#else
    const int allRows = 4096;
#endif
    cv::Mat all(allRows, 4096, CV_8UC3);
    for (int i = 0; i < allRows * 4096; ++i) {
        const int rgb = i * (4096 / allRows);
        all.at<cv::Vec3b>(i / 4096, i % 4096) = cv::Vec3b(rgb >> 16, (rgb >> 8) & 255, rgb & 255);
    }
    const cv::Mat images[] = {testimages::SyntheticPhotoRgb(480, 640), cv::Mat(40, 30, CV_8UC3, cv::Scalar(90, 140, 30)),
                              cv::Mat(1, 1, CV_8UC3, cv::Scalar(3, 200, 17)), twoLevels, noise, all};
    for (const cv::Mat& bgr : images) {
        cv::Mat lab(bgr.size(), CV_32FC3);
        ConvertToLab(bgr, lab);
        ColourStats fromLevels{}, bySort{};
        ASSERT_TRUE(ComputeLightnessStatsFromLevels(lab, fromLevels)) << bgr.size();
        ComputeLightnessStatsBySort(lab, bySort);
        EXPECT_EQ(std::memcmp(&fromLevels, &bySort, sizeof(ColourStats)), 0) << bgr.size();
    }
    ColourStats unchanged{};
    cv::Mat odd(2, 2, CV_32FC3, cv::Scalar(0.3, 0, 0));  // 0.3f is no table level
    EXPECT_FALSE(ComputeLightnessStatsFromLevels(odd, unchanged));
    EXPECT_FALSE(ComputeLightnessStatsFromLevels(cv::Mat(0, 0, CV_32FC3), unchanged));
}

// The fused summary of 8-bit pixels holds the bits of the Lab image's
// statistics (OpenCV's float and double sums included): photo-like and noise
// images over many bands, a row longer than a band, a column of two bands,
// strided views, flat and single pixels, in both byte orders, and the sample
// photographs at full size when they are in the cache.
TEST(ColourStatistics, SummaryOfPixelsEqualsTheLabImageStatisticsBitForBit) {
    cv::Mat noise(700, 1100, CV_8UC3), wide(3, 70001, CV_8UC3), tall(70001, 1, CV_8UC3);
    cv::randu(noise, cv::Scalar::all(0), cv::Scalar::all(256));
    cv::randu(wide, cv::Scalar::all(0), cv::Scalar::all(256));
    cv::randu(tall, cv::Scalar::all(0), cv::Scalar::all(256));
    const cv::Mat photo = testimages::SyntheticPhotoRgb(1200, 1700);
    std::vector<cv::Mat> images = {photo, noise, wide, tall, photo(cv::Rect(13, 7, 999, 1001)),
                                   cv::Mat(40, 30, CV_8UC3, cv::Scalar(90, 140, 30)),
                                   cv::Mat(1, 1, CV_8UC3, cv::Scalar(3, 200, 17)),
                                   cv::Mat(5, 3, CV_8UC3, cv::Scalar::all(128))};
    namespace fs = std::filesystem;
    const fs::path content = fs::path(VORA_SOURCE_DIR) / ".cache/photos/content";
    for (const char* name : {"astronaut.png", "grace_hopper.jpg"})
        if (fs::exists(content / name)) images.push_back(cv::imread((content / name).string(), cv::IMREAD_COLOR));

    std::vector<ColourStats> expected;
    for (const cv::Mat& bgr : images) {
        ASSERT_FALSE(bgr.empty());
        cv::Mat lab(bgr.size(), CV_32FC3), rgb;
        ConvertToLab(bgr, lab);
        expected.push_back(StatsOf(lab));
        cv::cvtColor(bgr, rgb, cv::COLOR_BGR2RGB);
        ColourStats fromBgr{}, fromRgb{};
        SummariseColours(bgr, ChannelOrder::Bgr, fromBgr);
        SummariseColours(rgb, ChannelOrder::Rgb, fromRgb);
        EXPECT_EQ(std::memcmp(&fromBgr, &expected.back(), sizeof(ColourStats)), 0) << bgr.size();
        EXPECT_EQ(std::memcmp(&fromRgb, &expected.back(), sizeof(ColourStats)), 0) << bgr.size();
    }
    // Pairs share one buffer, the second image overwriting the first's
    // chroma as it is read: each image with its neighbour (larger than it in
    // some pairs, smaller in others) and with itself.
    for (size_t i = 0; i < images.size(); ++i)
        for (const size_t other : {(i + 1) % images.size(), i}) {
            ColourStats first{}, second{};
            SummariseColourPair(images[i], images[other], ChannelOrder::Bgr, first, second);
            EXPECT_EQ(std::memcmp(&first, &expected[i], sizeof(ColourStats)), 0) << images[i].size() << " first";
            EXPECT_EQ(std::memcmp(&second, &expected[other], sizeof(ColourStats)), 0) << images[other].size();
        }
}

}  // namespace
}  // namespace vora
