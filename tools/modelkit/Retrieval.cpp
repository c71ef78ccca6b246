#include "modelkit/Retrieval.h"

#include <filesystem>
#include <limits>
#include <stdexcept>

#include <opencv2/core.hpp>

#include "model/FeatureNetwork.h"
#include "modelkit/Photos.h"
#include "semantic/NetworkInput.h"

namespace fs = std::filesystem;

namespace vora {
namespace modelkit {
namespace {

constexpr int kFeatureSize = 512;

struct Copy {
    int photo;
    int alteration;  // -1: the photo as it is
    std::vector<float> feature;
};

double SquaredDistance(const std::vector<float>& a, const std::vector<float>& b) {
    double sum = 0.0;
    for (size_t i = 0; i < a.size(); ++i) sum += (double(a[i]) - b[i]) * (double(a[i]) - b[i]);
    return sum;
}

}  // namespace

std::unique_ptr<FeatureNetwork> LoadModelNetwork(const std::string& modelDir) {
    const fs::path net = fs::path(modelDir) / kNetworkFolder;
    try {
        return FeatureNetwork::Load((net / kNetworkDefinitionName).string(), (net / kNetworkWeightsName).string());
    } catch (const cv::Exception& e) {
        throw std::runtime_error("cannot load the network of " + modelDir + ": " + e.what());
    }
}

std::vector<float> PhotoFeature(FeatureNetwork& network, const cv::Mat& bgr8) {
    cv::Mat canvas;
    PrepareNetworkImage(bgr8, canvas, kNetworkImageSize, kNetworkInputSize);
    std::vector<float> out = network.Forward(canvas);
    if (out.size() < static_cast<size_t>(kFeatureSize))
        throw std::runtime_error("the model's network gives fewer than 512 values");
    out.resize(kFeatureSize);
    return out;
}

RetrievalResult MeasureRetrieval(const std::string& modelDir, const std::vector<std::string>& photoPaths,
                                 const std::function<void(double, const std::string&)>& progress) {
    const std::unique_ptr<FeatureNetwork> network = LoadModelNetwork(modelDir);

    const auto& alterations = AllAlterations();
    std::vector<Copy> copies;
    for (size_t p = 0; p < photoPaths.size(); ++p) {
        if (progress) progress(double(p) / photoPaths.size(), fs::path(photoPaths[p]).filename().string());
        const cv::Mat photo = ReadPhotoBgr(photoPaths[p]);
        copies.push_back({int(p), -1, PhotoFeature(*network, photo)});
        for (size_t a = 0; a < alterations.size(); ++a)
            copies.push_back({int(p), int(a), PhotoFeature(*network, Alter(photo, alterations[a]))});
    }

    RetrievalResult result;
    result.photos = static_cast<int>(photoPaths.size());
    for (size_t q = 0; q < copies.size(); ++q) {
        if (copies[q].alteration < 0) continue;
        double best = std::numeric_limits<double>::infinity();
        size_t nearest = q;
        for (size_t c = 0; c < copies.size(); ++c) {
            if (c == q) continue;
            const double d = SquaredDistance(copies[q].feature, copies[c].feature);
            if (d < best) {
                best = d;
                nearest = c;
            }
        }
        ++result.queries;
        if (nearest != q && copies[nearest].photo == copies[q].photo) {
            ++result.found;
        } else {
            result.misses.push_back(fs::path(photoPaths[copies[q].photo]).filename().string() + " (" +
                                    AlterationName(alterations[copies[q].alteration]) + ") -> " +
                                    (nearest == q ? std::string("nothing")
                                                  : fs::path(photoPaths[copies[nearest].photo]).filename().string()));
        }
    }
    if (progress) progress(1.0, "done");
    return result;
}

}  // namespace modelkit
}  // namespace vora
