// The binary weights format: the mean blob reader (the project's own wire
// reader), and the network weights as the facade loads them beside a fixed
// definition. Errors are cv::Exception; anything else is a finding.
#include <cstddef>
#include <cstdint>
#include <string>

#include <opencv2/core.hpp>

#include "FuzzFiles.h"
#include "model/FeatureNetwork.h"
#include "model/MeanBlob.h"

namespace {

// The test fixtures' plain network: input -> global average pooling -> 512
// outputs (the seed corpus holds its weights).
constexpr char kDefinition[] = R"(name: "vora_fixture"
input: "data" input_shape { dim: 1 dim: 3 dim: 256 dim: 256 }
layer { name: "pool" type: "Pooling" bottom: "data" top: "pool" pooling_param { pool: AVE global_pooling: true } }
layer { name: "fc512" type: "InnerProduct" bottom: "pool" top: "fc512" inner_product_param { num_output: 512 } }
)";

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const std::string definition = vora::fuzz::WriteInput(
        "net.prototxt", reinterpret_cast<const uint8_t*>(kDefinition), sizeof kDefinition - 1);
    const std::string path = vora::fuzz::WriteInput("weights", data, size);
    try {
        (void)vora::ReadMeanBlob(path, 3, 8, 8);
    } catch (const cv::Exception&) {
    }
    try {
        (void)vora::FeatureNetwork::Load(definition, path);
    } catch (const cv::Exception&) {
    }
    return 0;
}
