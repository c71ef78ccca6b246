#include "model/Engine.h"

#include "model/StyleDatabase.h"

namespace vora {

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
