// compute_transfers (5 proposals) and compute_transfer toward a style image
// on a real photograph at 24 megapixels (BenchPhotos.h), with the sample
// model (network included; .cache/sample-model/, built by scripts/demo.sh) and
// with a fixture model whose network is tiny, so the two show what the
// network costs. Each reports the peak extra resident memory of one call,
// from VmHWM after resetting it, as bytes per pixel ("peak B/px").
#include <benchmark/benchmark.h>

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include <vora/vora.h>

#include "BenchPhotos.h"
#include "support/ModelFixtures.h"

namespace vora {
namespace {

struct Photo {
    std::vector<uint8_t> bytes;
    std::unique_ptr<IImage, void (*)(IImage*)> image{nullptr, DestroyImageObj};
};

// The photo as an image object; mirrored when asked, so a style image differs from the content.
Photo MakePhoto(bool mirrored) {
    Photo photo;
    cv::Mat rgb = bench::Photo24();
    if (mirrored) cv::flip(rgb, rgb, 1);
    photo.bytes.assign(rgb.data, rgb.data + rgb.total() * 3);
    const size_t width = rgb.cols, height = rgb.rows, layout[4] = {};
    photo.image.reset(CreateImageObj(height, width, 3, layout, photo.bytes.data(), {width, height}, {}));
    return photo;
}

// Runs `call` once untimed to read its peak extra memory, then times it.
template <class Call>
void Measure(benchmark::State& state, double pixels, Call&& call) {
    const double before = bench::CurrentMemory();
    bench::ResetPeakMemory();
    if (!call()) return state.SkipWithError("the call failed");
    state.counters["peak B/px"] = (bench::PeakMemory() - before) / pixels;
    for (auto _ : state) benchmark::DoNotOptimize(call());
}

std::string SampleModel() { return std::string(VORA_SOURCE_DIR) + "/.cache/sample-model/"; }

// Argument: 1 the sample model, 0 a fixture model.
void BM_ComputeTransfers(benchmark::State& state) {
    if (bench::Photo24().empty()) return state.SkipWithError("no sample photos; run scripts/fetch-photos.sh");
    const bool sample = state.range(0) != 0;
    if (sample && !std::filesystem::exists(SampleModel() + "styledb_style_1500.dat"))
        return state.SkipWithError("no sample model; run scripts/demo.sh");
    std::unique_ptr<fixtures::ModelFixture> fixture;
    if (!sample) fixture = std::make_unique<fixtures::ModelFixture>(fixtures::RandomDatabase(20, 40));
    const vora_api api(sample ? SampleModel() : fixture->modelDir());
    const Photo photo = MakePhoto(false);
    VoraParameters params;
    params.numTransfers = 5;
    std::vector<TRANSFER> out(params.numTransfers);
    Measure(state, static_cast<double>(bench::Photo24().total()),
            [&] { return api.compute_transfers(photo.image.get(), out, params) == STATUS_OK; });
}
BENCHMARK(BM_ComputeTransfers)->ArgName("sample")->Arg(1)->Arg(0)->Unit(benchmark::kMillisecond)->UseRealTime();

void BM_ComputeTransferToStyleImage(benchmark::State& state) {
    if (bench::Photo24().empty()) return state.SkipWithError("no sample photos; run scripts/fetch-photos.sh");
    const fixtures::ModelFixture fixture(fixtures::RandomDatabase(2, 4));
    const vora_api api(fixture.modelDir());
    const Photo content = MakePhoto(false), style = MakePhoto(true);
    const VoraParameters params;
    TRANSFER out;
    Measure(state, static_cast<double>(bench::Photo24().total()),
            [&] { return api.compute_transfer(content.image.get(), style.image.get(), out, params) == STATUS_OK; });
}
BENCHMARK(BM_ComputeTransferToStyleImage)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace
}  // namespace vora
