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
// Written while loading, read-only afterwards (facades share it between
// threads). A plain aggregate: each member frees itself.
struct Engine {
    // Reads the four data files, then the network from modelDir + "net/".
    // Missing or inconsistent data files leave tables empty or partial; a
    // missing or unreadable network file throws the network loader's
    // exception. Returns 0.
    int LoadModel(const std::string& modelDir);

    // True when every table needed to rank styles is present and the tables
    // agree with each other (and the network is loaded).
    bool CanRankStyles() const;

    // One 512-float centre per scene cluster, from the cluster file.
    std::vector<ClusterCentre> clusterCentres;
    // Per cluster, style indices best first: the better half, the rest -1.
    std::vector<std::vector<int32_t>> rankedStyles;
    // Per style, its colour statistics, from the style file.
    std::vector<ColourStats> styleRecords;
    // Distances between styles: the full symmetric matrix.
    std::vector<std::vector<float>> styleDistances;
    // The feature network; null until loaded.
    std::unique_ptr<FeatureNetwork> network;
    // The counts the files' headers give; they may exceed the tables when a
    // file was missing or rejected (CanRankStyles is then false).
    int32_t clusterCount = 0;
    int32_t styleCount = 0;
    int32_t scoreColumns = 0;
};

}  // namespace vora
