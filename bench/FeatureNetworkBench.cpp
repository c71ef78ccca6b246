// One forward pass of each feature network the model builder can write,
// through the library's loader and input preparation: the scene descriptor
// and the converted detector backbone (when scripts/fetch-network.sh has put
// it in .cache/network/). The argument is OpenCV's thread count.

#include <filesystem>
#include <memory>

#include <benchmark/benchmark.h>
#include <opencv2/core.hpp>

#include "model/FeatureNetwork.h"
#include "modelkit/SceneDescriptor.h"
#include "modelkit/TfjsConverter.h"
#include "semantic/NetworkInput.h"

namespace {

namespace fs = std::filesystem;

std::unique_ptr<vora::FeatureNetwork> Load(const vora::modelkit::NetworkFiles& files, const std::string& name) {
    const fs::path dir = fs::temp_directory_path() / ("vora_bench_" + name);
    fs::create_directories(dir);
    vora::modelkit::WriteNetworkFiles(files, dir.string());
    auto network = vora::FeatureNetwork::Load((dir / vora::kNetworkDefinitionName).string(),
                                              (dir / vora::kNetworkWeightsName).string());
    fs::remove_all(dir);
    return network;
}

void RunForward(benchmark::State& state, vora::FeatureNetwork& network) {
    const int saved = cv::getNumThreads();
    cv::setNumThreads(static_cast<int>(state.range(0)));
    cv::Mat photo(480, 640, CV_8UC3);
    cv::randu(photo, 0, 256);
    float feature[512];
    for (auto _ : state) {
        vora::ExtractFeature(network, photo, feature);
        benchmark::DoNotOptimize(feature[0]);
    }
    cv::setNumThreads(saved);
}

void BM_SceneDescriptorForward(benchmark::State& state) {
    cv::Mat rows(2, vora::modelkit::PooledFeatureSize(), CV_32F);
    cv::randu(rows, 0, 1);
    static auto network = Load(vora::modelkit::DescriptorNetwork(vora::modelkit::FitProjection(rows)), "scene");
    RunForward(state, *network);
}
BENCHMARK(BM_SceneDescriptorForward)->Arg(1)->Arg(2)->Unit(benchmark::kMillisecond);

void BM_NanodetBackboneForward(benchmark::State& state) {
    const fs::path folder = fs::path(VORA_SOURCE_DIR) / ".cache/network";
    if (!fs::exists(folder / vora::modelkit::kNanodetWeightsName)) {
        state.SkipWithError("no detector network; run scripts/fetch-network.sh");
        return;
    }
    static auto network = Load(vora::modelkit::ConvertTfjs(vora::modelkit::NanodetConversion(folder.string())), "nanodet");
    RunForward(state, *network);
}
BENCHMARK(BM_NanodetBackboneForward)->Arg(1)->Arg(2)->Unit(benchmark::kMillisecond);

}  // namespace
