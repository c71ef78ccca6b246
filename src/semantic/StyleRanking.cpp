#include "semantic/StyleRanking.h"

#include <algorithm>
#include <cassert>
#include <cfloat>
#include <cmath>

#include <opencv2/core.hpp>

#include "model/Engine.h"

namespace vora {

namespace {
constexpr float kThresholdFactor = 15.0f;
constexpr float kRelaxation = 0.8f;
}  // namespace

int OrderClusters(const Engine& engine, const float* feature, std::vector<int32_t>& order) {
    const int count = static_cast<int>(engine.clusterCentres.size());
    if (count == 0) return 0;
    cv::Mat distances(count, 1, CV_32F);
    for (int k = 0; k < count; ++k) {
        const ClusterCentre& centre = engine.clusterCentres[k];
        float sum = 0.0f;  // single precision, in component order
        for (size_t i = 0; i < centre.size(); ++i) {
            const float d = feature[i] - centre[i];
            sum += d * d;
        }
        distances.at<float>(k) = std::sqrt(sum);
    }
    cv::Mat indices;
    cv::sortIdx(distances, indices, cv::SORT_EVERY_COLUMN | cv::SORT_ASCENDING);
    for (int k = 0; k < count && k < static_cast<int>(order.size()); ++k) order[k] = indices.at<int>(k);
    return 0;
}

Status SelectStyles(const Engine& engine, const ColourStats& /*content*/, const std::vector<int32_t>& order,
                    std::vector<int32_t>& chosenClusters, std::vector<int32_t>& chosenStyles,
                    const VoraParameters& params) {
    const uint64_t wanted = params.numTransfers;
    assert(wanted >= 1);  // checked at the library's door
    if (order.empty() || order[0] < 0 || static_cast<size_t>(order[0]) >= engine.rankedStyles.size())
        return STATUS_MODEL_INCOMPLETE;

    const int32_t cluster = order[0];  // only the nearest cluster is consulted
    const std::vector<int32_t>& ranking = engine.rankedStyles[cluster];
    const size_t columns = std::min(ranking.size(), static_cast<size_t>(std::max(engine.scoreColumns, 0)));
    const size_t styles = engine.styleDistances.size();
    auto usable = [&](int32_t s) { return s >= 0 && static_cast<size_t>(s) < styles; };

    // Without one usable style the relaxation below could never complete.
    bool anyUsable = false;
    for (size_t p = 0; p < columns && !anyUsable; ++p) anyUsable = usable(ranking[p]);
    if (!anyUsable) return STATUS_NO_USABLE_STYLE;

    chosenClusters.resize(wanted);
    chosenStyles.resize(wanted);
    float threshold = params.rankingFactor * kThresholdFactor;
    uint64_t accepted = 0;
    for (;;) {
        for (size_t p = 0; p < columns; ++p) {
            const int32_t s = ranking[p];
            if (!usable(s)) continue;
            bool acceptable = true;
            for (uint64_t u = 0; u < accepted && acceptable; ++u) {
                const float distance = engine.styleDistances[s][chosenStyles[u]];
                if (std::sqrt(std::fabs(distance)) < threshold) acceptable = false;
            }
            if (!acceptable) continue;
            chosenClusters[accepted] = cluster;
            chosenStyles[accepted] = s;
            if (++accepted >= wanted) return STATUS_OK;
        }
        threshold *= kRelaxation;
        // Repeated multiplication sticks at the smallest subnormal and never
        // reaches 0; an infinite threshold never shrinks at all. Either way the
        // scan would not end, so finish the descent here: at 0 every style is
        // acceptable and already chosen ones are taken again.
        if (threshold < FLT_MIN) threshold = 0.0f;
        if (std::isinf(threshold)) threshold = FLT_MAX;
    }
}

}  // namespace vora
