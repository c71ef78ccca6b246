// Colour statistics of a 12-megapixel content image, and the tone curve fit.
#include <benchmark/benchmark.h>

#include <cmath>
#include <cstdint>
#include <vector>

#include <opencv2/core.hpp>

#include "BenchPhotos.h"
#include "color/LabByTables.h"
#include "transfer/ColourStatistics.h"
#include "transfer/SolveTransfer.h"

namespace {

constexpr int kWidth = 4000;
constexpr int kHeight = 3000;

// Photo-like B, G, R content: a sky-to-ground gradient, a few soft coloured
// blobs and sensor-like noise, so the lightness sort sees realistic data
// rather than long runs of equal values.
const cv::Mat& SyntheticPhoto() {
    static const cv::Mat photo = [] {
        cv::Mat image(kHeight, kWidth, CV_8UC3);
        cv::Mat noise(kHeight, kWidth, CV_16SC3);
        cv::randn(noise, cv::Scalar::all(0), cv::Scalar::all(6));
        const double blobs[3][5] = {{0.3, 0.6, 0.12, 60, -40}, {0.7, 0.4, 0.2, -50, 30}, {0.5, 0.8, 0.1, 20, 70}};
        for (int r = 0; r < kHeight; ++r) {
            const double y = static_cast<double>(r) / kHeight;
            cv::Vec3b* out = image.ptr<cv::Vec3b>(r);
            const cv::Vec3s* n = noise.ptr<cv::Vec3s>(r);
            for (int c = 0; c < kWidth; ++c) {
                const double x = static_cast<double>(c) / kWidth;
                double blue = 200.0 - 140.0 * y;
                double green = 170.0 - 90.0 * y + 20.0 * std::sin(6.0 * x);
                double red = 120.0 + 40.0 * y * y + 30.0 * std::cos(4.0 * x + y);
                for (const auto& b : blobs) {
                    const double d2 = ((x - b[0]) * (x - b[0]) + (y - b[1]) * (y - b[1])) / (b[2] * b[2]);
                    const double weight = std::exp(-d2);
                    red += b[3] * weight;
                    blue += b[4] * weight;
                }
                out[c] = cv::Vec3b(cv::saturate_cast<uint8_t>(blue + n[c][0]), cv::saturate_cast<uint8_t>(green + n[c][1]),
                                   cv::saturate_cast<uint8_t>(red + n[c][2]));
            }
        }
        return image;
    }();
    return photo;
}

const cv::Mat& SyntheticLab() {
    static const cv::Mat lab = [] {
        cv::Mat result(kHeight, kWidth, CV_32FC3);
        vora::ConvertToLab(SyntheticPhoto(), result);
        return result;
    }();
    return lab;
}

void ReportPixels(benchmark::State& state) {
    const int64_t pixels = static_cast<int64_t>(state.iterations()) * kWidth * kHeight;
    state.SetItemsProcessed(pixels);
    state.counters["MP/s"] = benchmark::Counter(static_cast<double>(pixels) / 1e6, benchmark::Counter::kIsRate);
}

void BM_ConvertToLab(benchmark::State& state) {
    const cv::Mat& photo = SyntheticPhoto();
    cv::Mat lab(photo.size(), CV_32FC3);
    for (auto _ : state) {
        vora::ConvertToLab(photo, lab);
        benchmark::DoNotOptimize(lab.data);
        benchmark::ClobberMemory();
    }
    ReportPixels(state);
}

void BM_ChromaStats(benchmark::State& state) {
    const cv::Mat& lab = SyntheticLab();
    vora::ColourStats stats{};
    for (auto _ : state) {
        vora::ComputeChromaStats(lab, stats);
        benchmark::DoNotOptimize(stats);
    }
    ReportPixels(state);
}

void BM_LightnessStats(benchmark::State& state) {
    const cv::Mat& lab = SyntheticLab();
    vora::ColourStats stats{};
    for (auto _ : state) {
        vora::ComputeLightnessStats(lab, stats);
        benchmark::DoNotOptimize(stats);
    }
    ReportPixels(state);
}

// What a compute call spends on the content image: conversion and both statistics.
void BM_ContentStatistics(benchmark::State& state) {
    const cv::Mat& photo = SyntheticPhoto();
    cv::Mat lab(photo.size(), CV_32FC3);
    vora::ColourStats stats{};
    for (auto _ : state) {
        vora::ConvertToLab(photo, lab);
        vora::ComputeChromaStats(lab, stats);
        vora::ComputeLightnessStats(lab, stats);
        benchmark::DoNotOptimize(stats);
    }
    ReportPixels(state);
}

// The same statistics fused, straight from the pixels, without the Lab image.
void BM_SummariseColours(benchmark::State& state) {
    const cv::Mat& photo = SyntheticPhoto();
    vora::ColourStats stats{};
    for (auto _ : state) {
        vora::SummariseColours(photo, vora::ChannelOrder::Bgr, stats);
        benchmark::DoNotOptimize(stats);
    }
    ReportPixels(state);
}

// The per-pixel conversion of the summary on one thread, real photo at 24
// megapixels, with each colour kernel this machine can run (argument: 0
// scalar, 1 AVX2), so the vector kernel's gain shows against the scalar one.
void BM_ChromaKernel(benchmark::State& state) {
    const auto kernel = static_cast<vora::VectorKernel>(state.range(0));
    const cv::Mat& photo = vora::bench::Photo24();
    if (photo.empty() || !vora::LabByTables::Available(kernel)) {
        state.SkipWithError(photo.empty() ? "sample photos not fetched" : "kernel not available here");
        return;
    }
    const vora::LabByTables& tables = vora::LabByTables::Get();
    std::vector<float> pairs(2 * photo.total());
    std::vector<int64_t> counts(vora::kTableSize);
    for (auto _ : state) {
        for (int row = 0; row < photo.rows; ++row)
            tables.ChromaOfPixels(kernel, photo.ptr<uint8_t>(row), static_cast<size_t>(photo.cols),
                                  vora::ChannelOrder::Rgb, pairs.data() + 2 * static_cast<size_t>(row) * photo.cols,
                                  counts.data());
        benchmark::DoNotOptimize(pairs.data());
        benchmark::ClobberMemory();
    }
    state.SetLabel(vora::LabByTables::Name(kernel));
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()) * static_cast<int64_t>(photo.total()));
}

void BM_FitToneCurve(benchmark::State& state) {
    vora::ColourStats content{};
    vora::ColourStats style{};
    for (int i = 0; i < 32; ++i) {
        const float x = static_cast<float>(i / 31.0);
        content.lightness[i] = x;
        style.lightness[i] = std::pow(x, 0.7f);
    }
    vora::TRANSFER transfer;
    const vora::VoraParameters params;
    for (auto _ : state) {
        vora::FitToneCurve(content, style, transfer, params);
        benchmark::DoNotOptimize(transfer.toneCurve);
    }
    state.SetItemsProcessed(state.iterations());
}

BENCHMARK(BM_ConvertToLab)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_ChromaStats)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_LightnessStats)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_ContentStatistics)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_SummariseColours)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_ChromaKernel)->ArgName("kernel")->Arg(0)->Arg(1)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_FitToneCurve)->Unit(benchmark::kMicrosecond);

}  // namespace
