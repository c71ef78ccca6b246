#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include <opencv2/imgproc.hpp>
#include <tbb/global_control.h>

#include "color/ApplyTransfer.h"
#include "color/ColorConversion.h"
#include "support/TestImages.h"

// Apply against the pixel formulas, the cached kernel against the plain one,
// and tiles, threads and copies against one serial whole-image run.
namespace vora {
namespace {

using testimages::Tile;

TRANSFER Identity() {
    TRANSFER t{0, 0, {0, 0}, {0, 0}, {1, 0, 0, 1}, {}, 0.0f, 1.0f, {}};
    for (int i = 0; i < 257; ++i) t.toneCurve[i] = std::min(i / 255.0f, 1.0f);
    return t;
}

// A curve flat, steep, flat and a non-symmetric chroma map about means away
// from zero; the same with a zero lightness spread; the first with two
// overlapping faces.
enum { kSteep, kNoSpread, kFaces };
std::vector<TRANSFER> Transfers() {
    TRANSFER steep{0, 0, {4.5f, -7.25f}, {-3, 12.5f}, {1.25f, 0.35f, -0.6f, 0.8f}, {}, 0.08f, 0.93f, {}};
    for (int i = 0; i < 257; ++i) {
        const float x = std::min(i / 255.0f, 1.0f);
        steep.toneCurve[i] = x < 0.3f ? 0.1f : std::min(1.0f, 0.1f + (x - 0.3f) * 3.0f);
    }
    TRANSFER flat = steep, faces = steep;
    flat.lightnessLow = flat.lightnessHigh = 0.45f;
    flat.chromaMatrix[1] = -1.5f;
    faces.faceCorrections = {{0.45f, 0.37f, 0.05f, 0.07f, 0.35f, 18, 20, 0.6f},
                             {0.52f, 0.41f, 0.04f, 0.05f, 0.4f, 10, 15, 0.75f}};
    return {steep, flat, faces};
}

// Out of place into a destination of 7s; a whole image prints the faces line if there are faces.
cv::Mat Applied(const cv::Mat& source, const TRANSFER& transfer, ApplyKernel kernel = ApplyKernel::Fastest,
                bool serial = false) {
    cv::Mat in = source.clone(), out(source.size(), source.type(), cv::Scalar::all(7));
    const testimages::ImageHandle inHandle(in), outHandle(out);
    testing::internal::CaptureStdout();
    (serial ? ApplyTransferSerial : ApplyTransfer)(inHandle.get(), transfer, outHandle.get(), kernel);
    const size_t faces = transfer.faceCorrections.size();
    EXPECT_EQ(testing::internal::GetCapturedStdout(), faces ? "Correct " + std::to_string(faces) + " faces!!\n" : "");
    return out;
}
int DifferentBytes(const cv::Mat& a, const cv::Mat& b) { return cv::countNonZero(cv::Mat(a != b).reshape(1)); }

// A face whose box is exactly [3/16, 13/16] both ways: rows and columns 3 and 13 lie on its edge.
TEST(ApplyTransfer, CorrectionBoxEdgeIsOutside) {
    const cv::Mat grey(16, 16, CV_8UC3, cv::Scalar::all(70));
    TRANSFER lifted = Identity();
    lifted.faceCorrections.push_back(FaceCorrection{0.5f, 0.5f, 0.125f, 0.125f, 0.3f, 0.0f, 0.0f, 0.5f});
    const cv::Mat with = Applied(grey, lifted), without = Applied(grey, Identity()), changed = with != without;
    EXPECT_EQ(cv::countNonZero(changed.reshape(1)), cv::countNonZero(changed(cv::Rect(4, 4, 9, 9)).reshape(1)));
    EXPECT_GT(with.at<cv::Vec3b>(8, 4)[0], without.at<cv::Vec3b>(8, 4)[0]);  // next to the edge the lift shows
    EXPECT_GT(with.at<cv::Vec3b>(8, 8)[0], without.at<cv::Vec3b>(8, 8)[0] + 20);
}

// Every 24-bit colour once, row by row; under the sanitizers (tens of times
// slower) every 7th colour, which still takes every value of every channel.
TEST(ApplyTransfer, CachedKernelGivesThePlainKernelsBytesForEveryColour) {
#if defined(__SANITIZE_ADDRESS__)
    const int step = 7;
#else
    const int step = 1;
#endif
    const int colours = (1 << 24) / step;
    cv::Mat all(colours / 4096 + 1, 4096, CV_8UC3, cv::Scalar::all(0));
    for (int i = 0; i < colours; ++i) {
        const int rgb = i * step;
        all.at<cv::Vec3b>(i / 4096, i % 4096) = cv::Vec3b(rgb >> 16, (rgb >> 8) & 255, rgb & 255);
    }
    for (const TRANSFER& transfer : Transfers()) {
        const cv::Mat plain = Applied(all, transfer, ApplyKernel::Plain);
        ASSERT_GT(DifferentBytes(plain, all), all.rows * all.cols);  // the transfer shows
        EXPECT_EQ(DifferentBytes(Applied(all, transfer), plain), 0) << transfer.faceCorrections.size() << " faces";
    }
    // Four-byte pixels take the scalar lookup (three-byte ones the vector one
    // where there is one); the destination's fourth byte (7) stays.
    cv::Mat four, fourth;
    cv::cvtColor(all, four, cv::COLOR_RGB2RGBA);
    const cv::Mat cached = Applied(four, Transfers()[kSteep]);
    EXPECT_EQ(DifferentBytes(cached, Applied(four, Transfers()[kSteep], ApplyKernel::Plain)), 0);
    cv::extractChannel(cached, fourth, 3);
    EXPECT_EQ(cv::countNonZero(fourth != 7), 0);
}

// A photo whose colours repeat (cache hits and evictions) and whose tilings
// below cut both face boxes, and its plain serial bytes for each transfer.
const cv::Mat& TilingPhoto() {
    static const cv::Mat photo = testimages::SyntheticPhotoRgb(1000, 1500);
    return photo;
}
const cv::Mat& SerialReference(int transfer = kFaces) {
    static const std::vector<cv::Mat> references = [] {
        std::vector<cv::Mat> out;
        for (const TRANSFER& t : Transfers()) out.push_back(Applied(TilingPhoto(), t, ApplyKernel::Plain, true));
        return out;
    }();
    return references[transfer];
}

// Random tilings whose cuts cross both face boxes, some tiles below the cache's threshold.
std::vector<std::vector<cv::Rect>> RandomTilings() {
    std::mt19937 random(20240611);
    std::vector<std::vector<cv::Rect>> tilings;
    for (int tiling = 0; tiling < 3; ++tiling) tilings.push_back(testimages::RandomTiling1500x1000(random, tiling + 2));
    return tilings;
}

// Applies the record tile by tile, in place or into a zeroed image; only the
// tile at the origin prints.
cv::Mat ApplyTiled(const TRANSFER& record, const std::vector<cv::Rect>& tiles, bool inPlace) {
    cv::Mat source = TilingPhoto().clone(), separate(source.size(), CV_8UC3, cv::Scalar::all(0));
    cv::Mat& destination = inPlace ? source : separate;
    testing::internal::CaptureStdout();
    for (const cv::Rect& r : tiles) ApplyTransfer(Tile(source, r).get(), record, Tile(destination, r).get());
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "Correct 2 faces!!\n");
    return destination;
}

// The first two checks guard the tests below against comparing unchanged
// images: the transfer and the faces both show in the reference.
TEST(ApplyTransfer, ParallelGivesTheSerialBytesOnAnyThreadCount) {
    EXPECT_GT(DifferentBytes(SerialReference(), TilingPhoto()), TilingPhoto().total() * 3 / 2);
    EXPECT_GT(DifferentBytes(SerialReference(), SerialReference(kSteep)), 10000);
    for (const size_t threads : {size_t{1}, size_t{4}}) {
        tbb::global_control limit(tbb::global_control::max_allowed_parallelism, threads);
        for (int t : {kSteep, kNoSpread, kFaces})
            EXPECT_EQ(DifferentBytes(Applied(TilingPhoto(), Transfers()[t]), SerialReference(t)), 0) << threads;
    }
}

TEST(ApplyTransfer, TilesInAnyOrderGiveTheWholeImageBytes) {
    for (const std::vector<cv::Rect>& tiles : RandomTilings())
        EXPECT_EQ(DifferentBytes(ApplyTiled(Transfers()[kFaces], tiles, false), SerialReference()), 0) << tiles.size();
}

TEST(ApplyTransfer, TilesInPlaceGiveTheWholeImageBytes) {
    for (const std::vector<cv::Rect>& tiles : RandomTilings())
        EXPECT_EQ(DifferentBytes(ApplyTiled(Transfers()[kFaces], tiles, true), SerialReference()), 0) << tiles.size();
}

// The record is used by value: a copy whose original is gone serves, and
// faces combine by maximum, so their order does not matter.
TEST(ApplyTransfer, ACopiedRecordWithItsFacesReorderedGivesTheSameBytes) {
    TRANSFER record = *std::make_unique<TRANSFER>(Transfers()[kFaces]);
    std::swap(record.faceCorrections[0], record.faceCorrections[1]);
    EXPECT_EQ(DifferentBytes(ApplyTiled(record, RandomTilings()[0], false), SerialReference()), 0);
}

}  // namespace
}  // namespace vora
