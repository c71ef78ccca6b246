// Throughput of apply on a 12-megapixel image, on one thread and on all,
// with and without faces. The same parallel entry is measured in both cases;
// the one-thread case only caps TBB's parallelism.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <unistd.h>

#include <cmath>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <vector>

#include <tbb/global_control.h>
#include <tbb/info.h>

#include "color/ApplyTransfer.h"

namespace vora {
namespace {

constexpr size_t kWidth = 4000;
constexpr size_t kHeight = 3000;

std::vector<uint8_t> SyntheticPhoto() {
    std::vector<uint8_t> bytes(kWidth * kHeight * 3);
    for (size_t y = 0; y < kHeight; ++y) {
        for (size_t x = 0; x < kWidth; ++x) {
            const double u = static_cast<double>(x) / kWidth, v = static_cast<double>(y) / kHeight;
            uint8_t* pixel = &bytes[(y * kWidth + x) * 3];
            pixel[0] = static_cast<uint8_t>(40 + 170 * u + 30 * std::sin(9 * v + 2 * u) + (x * 7 + y * 3) % 5);
            pixel[1] = static_cast<uint8_t>(60 + 120 * v + 40 * std::sin(7 * u - 3 * v) + (x * 5 + y) % 4);
            pixel[2] = static_cast<uint8_t>(50 + 150 * (1 - u * v) + 25 * std::cos(11 * u * v));
        }
    }
    return bytes;
}

TRANSFER Record(bool withFaces) {
    TRANSFER transfer;
    for (int i = 0; i < 256; ++i) {
        const float x = static_cast<float>(i) / 255.0f;
        transfer.toneCurve[i] = x * x * (3.0f - 2.0f * x);
    }
    transfer.toneCurve[256] = 1.0f;
    transfer.lightnessLow = 0.05f;
    transfer.lightnessHigh = 0.95f;
    transfer.contentMean[0] = 3.0f;
    transfer.contentMean[1] = -6.0f;
    transfer.styleMean[0] = -2.0f;
    transfer.styleMean[1] = 10.0f;
    transfer.chromaMatrix[0] = 0.9f;
    transfer.chromaMatrix[1] = 0.3f;
    transfer.chromaMatrix[2] = -0.2f;
    transfer.chromaMatrix[3] = 1.1f;
    if (withFaces) {
        // Two portrait-sized faces: their boxes cover about 10 % of the image.
        transfer.faceCorrections.push_back(FaceCorrection{0.35f, 0.40f, 0.04f, 0.055f, 0.3f, 15.0f, 18.0f, 0.6f});
        transfer.faceCorrections.push_back(FaceCorrection{0.65f, 0.42f, 0.035f, 0.05f, 0.35f, 12.0f, 16.0f, 0.7f});
    }
    return transfer;
}

// Arguments: threads (0 = all that TBB offers), faces (0 or 1).
void BM_Apply(benchmark::State& state) {
    const size_t threads = state.range(0) > 0 ? static_cast<size_t>(state.range(0))
                                              : static_cast<size_t>(tbb::info::default_concurrency());
    tbb::global_control limit(tbb::global_control::max_allowed_parallelism, threads);
    const TRANSFER transfer = Record(state.range(1) != 0);

    std::vector<uint8_t> source = SyntheticPhoto();
    std::vector<uint8_t> destination(source.size());
    const size_t layout[4] = {0, 0, 0, 0};
    auto destroy = [](IImage* image) { DestroyImageObj(image); };
    std::unique_ptr<IImage, decltype(destroy)> in(
        CreateImageObj(kHeight, kWidth, 3, layout, source.data(), {kWidth, kHeight}, {}), destroy);
    std::unique_ptr<IImage, decltype(destroy)> out(
        CreateImageObj(kHeight, kWidth, 3, layout, destination.data(), {kWidth, kHeight}, {}), destroy);

    // Keep the faces line (printed by every whole-image call) out of the report.
    std::fflush(stdout);
    const int savedStdout = dup(STDOUT_FILENO);
    const int devNull = open("/dev/null", O_WRONLY);
    if (devNull >= 0) dup2(devNull, STDOUT_FILENO);
    for (auto _ : state) {
        ApplyTransfer(in.get(), transfer, out.get());
        benchmark::DoNotOptimize(destination.data());
        benchmark::ClobberMemory();
    }
    std::fflush(stdout);
    if (savedStdout >= 0) {
        dup2(savedStdout, STDOUT_FILENO);
        close(savedStdout);
    }
    if (devNull >= 0) close(devNull);

    const double pixels = static_cast<double>(kWidth * kHeight);
    state.SetItemsProcessed(state.iterations() * static_cast<int64_t>(kWidth * kHeight));
    state.counters["threads"] = static_cast<double>(threads);
    state.counters["MP/s"] =
        benchmark::Counter(pixels * static_cast<double>(state.iterations()) / 1e6, benchmark::Counter::kIsRate);
}
BENCHMARK(BM_Apply)
    ->ArgNames({"threads", "faces"})
    ->Args({1, 0})
    ->Args({0, 0})
    ->Args({1, 1})
    ->Args({0, 1})
    ->Unit(benchmark::kMillisecond)
    ->UseRealTime();

}  // namespace
}  // namespace vora
