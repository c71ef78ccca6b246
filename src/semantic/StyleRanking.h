#pragma once

#include <cstdint>
#include <vector>

#include <vora/vora.h>

#include "transfer/ColourStatistics.h"

namespace vora {

struct Engine;

// Fills order (sized by the caller to the cluster count) with cluster indices
// from nearest to farthest. Returns 0.
int OrderClusters(const Engine& engine, const float* feature, std::vector<int32_t>& order);

// Greedy, score-ordered choice of params.numTransfers (at least 1) mutually
// distant styles from the nearest cluster's ranking. Returns 0, or a failure
// status when the selection could never finish (no nearest cluster in the
// rankings, no valid style in its ranking).
Status SelectStyles(const Engine& engine, const ColourStats& content, const std::vector<int32_t>& order,
                    std::vector<int32_t>& chosenClusters, std::vector<int32_t>& chosenStyles,
                    const VoraParameters& params);

}  // namespace vora
