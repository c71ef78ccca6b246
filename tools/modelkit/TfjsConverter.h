#pragma once

// Converts a TensorFlow.js graph model (model.json with `modelTopology` and
// `weightsManifest`, weights in .bin shards) into the feature network files
// the library loads: a MemoryData input that takes the library's 256 x 256
// B, G, R canvas, crops its centre and subtracts the means; the graph's
// layers up to a named tensor; and a global average of that tensor, the
// feature. Only the tensor's ancestors are written. The conversion is exact
// or refused: every refusal is a ConversionError naming its cause.

#include <array>
#include <stdexcept>
#include <string>
#include <vector>

#include "modelkit/SceneDescriptor.h"

namespace vora {
namespace modelkit {

class ConversionError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

struct TfjsConversion {
    std::string modelJson;         // path of model.json; shards are read beside it
    std::string featureTensor;     // node name, optionally with ":0"
    // Normalisation the network expects, per channel in its own input order:
    // (pixel - mean) / std. The means go to the input layer; 1 / std is
    // folded into the first convolution.
    std::array<float, 3> mean{{0.0f, 0.0f, 0.0f}};
    std::array<float, 3> std{{1.0f, 1.0f, 1.0f}};
    bool rgbInput = true;          // the network reads R, G, B (the library feeds B, G, R)
    int crop = 0;                  // side of the centre crop of the canvas fed to the graph
    int featureChannels = 512;     // channels the feature tensor must have
    std::string networkName = "vora_tfjs_feature";
};

// Throws ConversionError (unsupported op, unknown tensor, a crop at which a
// layer's size or padding cannot be kept, missing or truncated shards,
// unhandled dtypes, a feature of the wrong width).
NetworkFiles ConvertTfjs(const TfjsConversion& conversion);

// The sample model's network: the backbone of a COCO object detector
// (nanodet.json and nanodet.bin in folder), its 512-channel stride-32 map
// averaged, at a crop of 225 (1 + 32 x 7, so every strided layer sees an odd
// size), B, G, R input with the detector's own normalisation.
TfjsConversion NanodetConversion(const std::string& folder);
extern const char* const kNanodetModelName;    // "nanodet.json"
extern const char* const kNanodetWeightsName;  // "nanodet.bin"

// IEEE half to float, exactly (subnormals, infinities and NaN included).
float HalfToFloat(uint16_t half);

}  // namespace modelkit
}  // namespace vora
