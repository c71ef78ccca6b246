#pragma once

// Builds a model directory (the four style database files and the feature
// network) from a folder of style photographs.

#include <functional>
#include <memory>
#include <string>

#include "modelkit/SceneDescriptor.h"

namespace vora {
namespace modelkit {

struct BuildModelOptions {
    std::string stylesDir;   // style photographs (required)
    std::string contentDir;  // content photographs for clustering; empty: the styles and altered copies
    std::string outDir;      // model directory to write
    int clusters = 0;        // 0: a sensible default from the sample count (at most 1000)
    // Called with the fraction done (0..1) and what is being done now.
    std::function<void(double, const std::string&)> progress;
    // A ready feature network (512 outputs, taken as they are); null: the
    // scene descriptor, its final map fitted on the photos.
    std::shared_ptr<const NetworkFiles> network;
};

// Writes outDir/{four .dat files} and outDir/net/{deploy2.prototxt,
// caffe_reduce_512_model}. The same inputs give the same bytes. Throws
// std::runtime_error with a one-line, plain-words message on failure.
void BuildModel(const BuildModelOptions& options);

}  // namespace modelkit
}  // namespace vora
