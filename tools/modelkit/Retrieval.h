#pragma once

// How well a model's feature network recognises a scene: every photo and its
// altered copies (Photos.h) go through the network exactly as the library
// runs it; each altered copy is a query, and it counts as found when its
// nearest neighbour (Euclidean) among all other copies of all photos is a
// copy of the same photo.

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <opencv2/core.hpp>

namespace vora {

class FeatureNetwork;

namespace modelkit {

// The network of a model directory (its net/ folder), loaded as the library
// loads it. Throws std::runtime_error naming the directory when it cannot be.
std::unique_ptr<FeatureNetwork> LoadModelNetwork(const std::string& modelDir);

// A photo's 512 feature values, computed as the library computes them
// (network input canvas, one forward pass, the first 512 outputs). Throws
// std::runtime_error when the network gives fewer.
std::vector<float> PhotoFeature(FeatureNetwork& network, const cv::Mat& bgr8);

struct RetrievalResult {
    int photos = 0;
    int queries = 0;
    int found = 0;
    std::vector<std::string> misses;  // "photo (alteration) -> nearest photo"

    double Rate() const { return queries > 0 ? double(found) / queries : 0.0; }
};

// Throws std::runtime_error when the network cannot be loaded or a photo
// cannot be read.
RetrievalResult MeasureRetrieval(const std::string& modelDir, const std::vector<std::string>& photoPaths,
                                 const std::function<void(double, const std::string&)>& progress = {});

}  // namespace modelkit
}  // namespace vora
