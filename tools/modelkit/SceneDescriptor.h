#pragma once

// The training-free scene descriptor: a fixed network of analytic filters
// whose output plays the part of the semantic feature (512 floats). It reads
// the library's network input (a 256 x 256 BGR canvas whose MemoryData layer
// crops the 227 x 227 centre and maps bytes to (byte - 128) / 128) and
// computes:
//   - an opponent-colour projection (1x1 convolution): intensity,
//     red-green, yellow-blue;
//   - a four-level intensity pyramid (binomial blur, stride 2), and at each
//     level a bank of Gabor filters in quadrature pairs at six orientations,
//     rectified (absolute value);
//   - average pooling of the rectified responses over 4 x 4, 2 x 2 and 1 x 1
//     grids, quadrature pairs summed (a local energy), square-root compressed;
//   - the opponent colours averaged over the same grids (a coarse layout);
//   - a final InnerProduct to 512 values: standardisation, then a principal
//     component projection with damped whitening fitted on a photo corpus.
// Only layer types that OpenCV's dnn Caffe importer runs are used:
// Convolution, AbsVal, Pooling (AVE), Flatten, Concat, Power, InnerProduct.

#include <string>
#include <vector>

#include <opencv2/core.hpp>

#include "modelkit/NetworkWriter.h"

namespace vora {
namespace modelkit {

constexpr int kDescriptorSize = 512;

// Names of the output tops: the pooled features before the final map, and
// the descriptor itself.
extern const char* const kFeaturesTop;    // "features"
extern const char* const kDescriptorTop;  // "descriptor"

// A network as written to a model's "net/" folder: the text definition and
// the layers that carry weights.
struct NetworkFiles {
    std::string definition;
    std::vector<WeightsLayer> weights;
    std::string name = "vora_scene_descriptor";  // the weights file's net name
};

// The final linear map: descriptor = weights * features + bias, weights row
// major with kDescriptorSize rows of featureSize columns.
struct Projection {
    int featureSize = 0;
    std::vector<float> weights;
    std::vector<float> bias;
};

// Length of the pooled feature vector (the "features" top).
int PooledFeatureSize();

// The network without the final map; its output is the "features" top.
NetworkFiles PooledFeatureNetwork();

// The complete descriptor network; its output is the "descriptor" top.
NetworkFiles DescriptorNetwork(const Projection& projection);

// Fits the final map on pooled features (one CV_32F row per photo): each
// column standardised, then projected on the principal components in
// decreasing order of variance, each divided by sqrt(variance + damping x
// largest variance). Components beyond the data's rank, or beyond the
// feature length, are zero rows. Deterministic: the same rows give the same
// map, with each component's sign fixed by its largest entry.
Projection FitProjection(const cv::Mat& pooledFeatures, double damping = 0.05);

// Applies the map in double precision (the builder's own use: clustering).
std::vector<float> Project(const Projection& projection, const float* pooled);

// Writes dir/deploy2.prototxt and dir/caffe_reduce_512_model (dir must
// exist). Throws std::runtime_error naming the file on failure.
void WriteNetworkFiles(const NetworkFiles& network, const std::string& dir);

}  // namespace modelkit
}  // namespace vora
