#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "model/FeatureNetwork.h"
#include "transfer/ColourStatistics.h"

namespace vora {

using ClusterCentre = std::array<float, 512>;

// The model behind a facade: the feature network and the style database.
// Written while loading, read-only afterwards.
class Engine {
public:
    Engine();
    ~Engine();
    Engine(const Engine&) = delete;
    Engine& operator=(const Engine&) = delete;

    // Reads the four data files, then the network from modelDir + "net/".
    // Missing or inconsistent data files leave tables empty or partial; a
    // missing or unreadable network file throws the network loader's
    // exception. Returns 0.
    int LoadModel(const std::string& modelDir);

    // True when every table needed to rank styles is present and the tables
    // agree with each other (and the network is loaded).
    bool CanRankStyles() const;

    std::vector<ClusterCentre> clusterCentres;
    std::vector<std::vector<int32_t>> rankedStyles;  // per cluster; better half, rest -1
    std::vector<ColourStats> styleRecords;
    std::vector<std::vector<float>> styleDistances;  // full symmetric matrix
    std::unique_ptr<FeatureNetwork> network;
    int32_t clusterCount = 0;
    int32_t styleCount = 0;
    int32_t scoreColumns = 0;
};

}  // namespace vora
