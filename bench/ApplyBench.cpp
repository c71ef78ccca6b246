// Apply on a real photograph at 24 megapixels (6000 x 4000), on one thread
// and on all, with and without faces, for the plain per-pixel kernel and the
// fastest one; beside them, in the same run, OpenCV's own 8-bit RGB -> Lab ->
// RGB round trip (the peer) and a memcpy of the image (the floor). Each apply
// figure also reports itself as a share of the round trip on as many threads
// ("x OpenCV", the round trip timed in the same run).
//
// The photo is described in BenchPhotos.h; its count of distinct colours is
// printed as the counter "colours".
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <map>
#include <memory>
#include <vector>

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>
#include <tbb/global_control.h>
#include <tbb/info.h>

#include "BenchPhotos.h"
#include "color/ApplyTransfer.h"

namespace vora {
namespace {

size_t Threads(int64_t argument) {
    return argument > 0 ? static_cast<size_t>(argument) : static_cast<size_t>(tbb::info::default_concurrency());
}

void BM_MemcpyFloor(benchmark::State& state) {
    const cv::Mat& photo = bench::Photo24();
    if (photo.empty()) return state.SkipWithError("no sample photos; run scripts/fetch-photos.sh");
    std::vector<uint8_t> copy(photo.total() * 3);
    for (auto _ : state) {
        std::memcpy(copy.data(), photo.data, copy.size());
        benchmark::DoNotOptimize(copy.data());
        benchmark::ClobberMemory();
    }
}
BENCHMARK(BM_MemcpyFloor)->Unit(benchmark::kMillisecond)->UseRealTime();

void OpenCvRoundTrip(const cv::Mat& photo, cv::Mat& lab, cv::Mat& back) {
    cv::cvtColor(photo, lab, cv::COLOR_RGB2Lab);
    cv::cvtColor(lab, back, cv::COLOR_Lab2RGB);
    benchmark::DoNotOptimize(back.data);
}

// OpenCV's own round trip; threads as OpenCV's thread count.
void BM_OpenCvLabRoundTrip(benchmark::State& state) {
    const cv::Mat& photo = bench::Photo24();
    if (photo.empty()) return state.SkipWithError("no sample photos; run scripts/fetch-photos.sh");
    const int saved = cv::getNumThreads();
    cv::setNumThreads(static_cast<int>(Threads(state.range(0))));
    cv::Mat lab, back;
    for (auto _ : state) OpenCvRoundTrip(photo, lab, back);
    cv::setNumThreads(saved);
    state.counters["threads"] = static_cast<double>(Threads(state.range(0)));
}

// The round trip's median time over 5 calls on `threads` threads, measured
// once per thread count in the run, so each apply figure has its peer's
// figure from the same minutes beside it.
double OpenCvRoundTripSeconds(const cv::Mat& photo, size_t threads) {
    static std::map<size_t, double> measured;
    const auto found = measured.find(threads);
    if (found != measured.end()) return found->second;
    const int saved = cv::getNumThreads();
    cv::setNumThreads(static_cast<int>(threads));
    cv::Mat lab, back;
    OpenCvRoundTrip(photo, lab, back);  // warm-up: the outputs are allocated here
    std::vector<double> times;
    for (int i = 0; i < 5; ++i) {
        const auto start = std::chrono::steady_clock::now();
        OpenCvRoundTrip(photo, lab, back);
        times.push_back(std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
    }
    cv::setNumThreads(saved);
    std::sort(times.begin(), times.end());
    return measured[threads] = times[times.size() / 2];
}
BENCHMARK(BM_OpenCvLabRoundTrip)->ArgName("threads")->Arg(1)->Arg(0)->Unit(benchmark::kMillisecond)->UseRealTime();

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

// Arguments: threads (0 = all that TBB offers), faces (0 or 1), kernel
// (0 the fastest, 1 the plain per-pixel form).
void BM_Apply(benchmark::State& state) {
    const cv::Mat& photo = bench::Photo24();
    if (photo.empty()) return state.SkipWithError("no sample photos; run scripts/fetch-photos.sh");
    const size_t threads = Threads(state.range(0));
    tbb::global_control limit(tbb::global_control::max_allowed_parallelism, threads);
    const TRANSFER transfer = Record(state.range(1) != 0);
    const ApplyKernel kernel = state.range(2) == 0 ? ApplyKernel::Fastest : ApplyKernel::Plain;

    std::vector<uint8_t> source(photo.data, photo.data + photo.total() * 3);
    std::vector<uint8_t> destination(source.size());
    const size_t width = photo.cols, height = photo.rows;
    const size_t layout[4] = {0, 0, 0, 0};
    auto destroy = [](IImage* image) { DestroyImageObj(image); };
    std::unique_ptr<IImage, decltype(destroy)> in(
        CreateImageObj(height, width, 3, layout, source.data(), {width, height}, {}), destroy);
    std::unique_ptr<IImage, decltype(destroy)> out(
        CreateImageObj(height, width, 3, layout, destination.data(), {width, height}, {}), destroy);

    // Keep the faces line (printed by every whole-image call) out of the report.
    std::fflush(stdout);
    const int savedStdout = dup(STDOUT_FILENO);
    const int devNull = open("/dev/null", O_WRONLY);
    if (devNull >= 0) dup2(devNull, STDOUT_FILENO);
    const auto start = std::chrono::steady_clock::now();
    for (auto _ : state) {
        ApplyTransfer(in.get(), transfer, out.get(), kernel);
        benchmark::DoNotOptimize(destination.data());
        benchmark::ClobberMemory();
    }
    const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count() /
                           static_cast<double>(state.iterations());
    std::fflush(stdout);
    if (savedStdout >= 0) {
        dup2(savedStdout, STDOUT_FILENO);
        close(savedStdout);
    }
    if (devNull >= 0) close(devNull);

    static const double colours = bench::DistinctColours(photo);
    state.counters["colours"] = colours;
    state.counters["threads"] = static_cast<double>(threads);
    // Apply's time as a share of OpenCV's round trip on as many threads.
    state.counters["x OpenCV"] = seconds / OpenCvRoundTripSeconds(photo, threads);
    state.counters["MP/s"] = benchmark::Counter(static_cast<double>(photo.total()) / 1e6 *
                                                    static_cast<double>(state.iterations()),
                                                benchmark::Counter::kIsRate);
}
BENCHMARK(BM_Apply)
    ->ArgNames({"threads", "faces", "plain"})
    ->ArgsProduct({{1, 0}, {0, 1}, {0, 1}})
    ->Unit(benchmark::kMillisecond)
    ->UseRealTime();

}  // namespace
}  // namespace vora
