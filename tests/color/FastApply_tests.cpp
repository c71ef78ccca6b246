#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <random>
#include <vector>

#include <tbb/global_control.h>

#include "color/ApplyTransfer.h"
#include "support/TestImages.h"

// The cached kernel against the plain per-pixel one: the same bytes for every
// input colour, for tilings whose edges cut face boxes, in place and out of
// place, on one thread and on all.
namespace vora {
namespace {

using testimages::Tile;

cv::Mat Applied(const cv::Mat& source, const TRANSFER& transfer, ApplyKernel kernel, bool serial = false) {
    cv::Mat in = source.clone(), out(source.size(), source.type(), cv::Scalar::all(7));
    const testimages::ImageHandle inHandle(in), outHandle(out);
    testing::internal::CaptureStdout();
    if (serial)
        ApplyTransferSerial(inHandle.get(), transfer, outHandle.get(), kernel);
    else
        ApplyTransfer(inHandle.get(), transfer, outHandle.get(), kernel);
    testing::internal::GetCapturedStdout();
    return out;
}
int DifferentBytes(const cv::Mat& a, const cv::Mat& b) { return cv::countNonZero(cv::Mat(a != b).reshape(1)); }

// Curves with steep and flat stretches, non-symmetric chroma maps, a zero
// lightness spread, and faces.
std::vector<TRANSFER> Transfers() {
    std::vector<TRANSFER> transfers;
    TRANSFER steep{0, 0, {4.5f, -7.25f}, {-3, 12.5f}, {1.25f, 0.35f, -0.6f, 0.8f}, {}, 0.08f, 0.93f, {}};
    for (int i = 0; i < 257; ++i) {
        const float x = std::min(i / 255.0f, 1.0f);
        steep.toneCurve[i] = x < 0.3f ? 0.1f : std::min(1.0f, 0.1f + (x - 0.3f) * 3.0f);  // flat, steep, flat
    }
    transfers.push_back(steep);
    TRANSFER flat = steep;
    flat.lightnessLow = flat.lightnessHigh = 0.45f;
    flat.chromaMatrix[1] = -1.5f;
    transfers.push_back(flat);
    TRANSFER faces = steep;
    faces.faceCorrections = {{0.45f, 0.37f, 0.05f, 0.07f, 0.35f, 18, 20, 0.6f},
                             {0.52f, 0.41f, 0.04f, 0.05f, 0.4f, 10, 15, 0.75f}};
    transfers.push_back(faces);
    return transfers;
}

// Every 24-bit colour once, row by row; under the sanitizers (tens of times
// slower) every 7th colour, which still takes every value of every channel.
TEST(FastApply, EveryColourGivesThePlainKernelsBytes) {
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
        EXPECT_EQ(DifferentBytes(Applied(all, transfer, ApplyKernel::Fastest), plain), 0)
            << transfer.faceCorrections.size() << " faces, low " << transfer.lightnessLow;
    }
}

// A photo whose colours repeat (cache hits and evictions), cut into random
// tiles, some below the cache's threshold, applied in random order.
TEST(FastApply, TilingsAcrossFacesAndThreadCountsGiveThePlainKernelsBytes) {
    const cv::Mat photo = testimages::SyntheticPhotoRgb(1000, 1500);
    std::mt19937 random(20261124);
    for (const TRANSFER& transfer : Transfers()) {
        const cv::Mat reference = Applied(photo, transfer, ApplyKernel::Plain, true);
        for (const size_t threads : {size_t{1}, size_t{4}}) {
            tbb::global_control limit(tbb::global_control::max_allowed_parallelism, threads);
            EXPECT_EQ(DifferentBytes(Applied(photo, transfer, ApplyKernel::Fastest), reference), 0) << threads;
            const std::vector<cv::Rect> tiles = testimages::RandomTiling1500x1000(random, 3);
            cv::Mat inPlace = photo.clone();
            testing::internal::CaptureStdout();
            for (const cv::Rect& r : tiles) ApplyTransfer(Tile(inPlace, r).get(), transfer, Tile(inPlace, r).get());
            testing::internal::GetCapturedStdout();
            EXPECT_EQ(DifferentBytes(inPlace, reference), 0) << threads << " threads, " << tiles.size() << " tiles";
        }
    }
}

}  // namespace
}  // namespace vora
