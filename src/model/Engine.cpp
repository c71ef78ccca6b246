#include "model/Engine.h"

#include <algorithm>

#include "model/StyleDatabase.h"

namespace vora {

// The network library keeps no global file root here: the network folder is
// joined with each file name instead, which gives the same paths.
Engine::Engine() = default;

Engine::~Engine() {
    clusterCentres.clear();
    styleRecords.clear();

    // The row loops run by the counts, which may exceed the tables when a file
    // was missing or rejected.
    const size_t rankedRows = std::min(rankedStyles.size(), static_cast<size_t>(std::max(clusterCount, 0)));
    for (size_t r = 0; r < rankedRows; ++r) rankedStyles[r].clear();
    rankedStyles.clear();

    const size_t distanceRows = std::min(styleDistances.size(), static_cast<size_t>(std::max(styleCount, 0)));
    for (size_t r = 0; r < distanceRows; ++r) styleDistances[r].clear();
    styleDistances.clear();

    network.reset();

    std::vector<std::vector<float>>().swap(styleDistances);
    std::vector<ColourStats>().swap(styleRecords);
    std::vector<std::vector<int32_t>>().swap(rankedStyles);
    std::vector<ClusterCentre>().swap(clusterCentres);
}

int Engine::LoadModel(const std::string& modelDir) {
    // Order matters: the scores reader checks the counts the first two set.
    ReadClusterCentres(*this, modelDir);
    (void)ReadStyleRecords(*this, DataFilePath(modelDir, kStyleFileName));
    (void)ReadScoresAndDistances(*this, modelDir);

    network.reset();
    // "net/" is appended with no separator: a directory "m" gives "mnet/".
    const std::string networkFolder = modelDir + kNetworkFolder;
    network = FeatureNetwork::Load(networkFolder + kNetworkDefinitionName, networkFolder + kNetworkWeightsName);
    return 0;
}

bool Engine::CanRankStyles() const {
    if (!network || clusterCount <= 0 || styleCount <= 0) return false;
    const size_t clusters = static_cast<size_t>(clusterCount);
    const size_t styles = static_cast<size_t>(styleCount);
    if (clusterCentres.size() != clusters || styleRecords.size() != styles) return false;
    if (scoreColumns != styleCount || rankedStyles.size() != clusters) return false;
    for (const std::vector<int32_t>& row : rankedStyles)
        if (row.size() != styles) return false;
    if (styleDistances.size() != styles) return false;
    for (const std::vector<float>& row : styleDistances)
        if (row.size() != styles) return false;
    return true;
}

}  // namespace vora
