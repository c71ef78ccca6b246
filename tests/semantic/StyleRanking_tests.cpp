#include <gtest/gtest.h>

#include <algorithm>
#include <limits>
#include <regex>
#include <string>
#include <vector>

#include "model/Engine.h"
#include "semantic/StyleRanking.h"

namespace vora {
namespace {

using Table = std::vector<std::vector<float>>;

Table Roots(size_t n, float d) {  // every style d from every other
    Table roots(n, std::vector<float>(n, d));
    for (size_t i = 0; i < n; ++i) roots[i][i] = 0.0f;
    return roots;
}

// Runs the selection on an engine with these rankings (one row per cluster) and style
// distances (roots; the engine stores squares). Returns "styles ... from <clusters>"
// or the refusal.
std::string Select(const std::vector<std::vector<int32_t>>& ranking, Table distances, uint64_t n, float factor,
                   int32_t nearest = 0) {
    Engine engine;
    for (auto& row : distances) std::transform(row.begin(), row.end(), row.begin(), [](float v) { return v * v; });
    engine.rankedStyles = ranking;
    engine.styleDistances = distances;
    engine.styleCount = engine.scoreColumns = static_cast<int32_t>(distances.size());
    VoraParameters params;
    params.numTransfers = n;
    params.rankingFactor = factor;
    std::vector<int32_t> clusters, styles;
    const Status status = SelectStyles(engine, ColourStats{}, {nearest}, clusters, styles, params);
    std::string text = status == STATUS_OK ? "styles" : "refused " + std::to_string(status);
    for (int32_t s : styles) text += " " + std::to_string(s);
    text += " from";
    for (int32_t c : clusters) text += " " + std::to_string(c);
    return text;
}
std::string Refused(Status status) { return "refused " + std::to_string(status) + " from"; }

TEST(SelectStyles, ChoosesInScoreOrderKeepingStylesApart) {
    EXPECT_EQ(Select({{2, -1, 0, 1}}, Roots(4, 1), 3, 0.0f), "styles 2 0 1 from 0 0 0");  // no diversity: score order
    // t = 15 skips style 1, only 14 from style 0, and takes style 2 at exactly 15.
    EXPECT_EQ(Select({{0, 1, 2}}, {{0, 14, 15}, {14, 0, 15}, {15, 15, 0}}, 2, 1.0f), "styles 0 2 from 0 0");
    // t relaxes 15 -> 12 -> 9.6; at 9.6 style 2 (9 from style 0) still fails and style 1 (10) passes.
    EXPECT_EQ(Select({{0, 2, 1}}, {{0, 10, 9}, {10, 0, 12}, {9, 12, 0}}, 2, 1.0f), "styles 0 1 from 0 0");
    // Two valid entries: once t has shrunk to 0 the chosen ones pass again, in scan order.
    EXPECT_EQ(Select({{1, 0, -1, -1}}, Roots(4, 30), 4, 1.0f), "styles 1 0 1 0 from 0 0 0 0");
    EXPECT_EQ(Select({{0, 1, -1}, {2, 1, -1}}, Roots(3, 20), 2, 1.0f, 1), "styles 2 1 from 1 1");  // nearest only
}

// A ranking without a usable style, which could never finish, is refused at the
// facade (ComputeDriver.ModelsThatCannotServeAreRefused).
TEST(SelectStyles, RefusesAnAbsentClusterAndEndsWithExtremeFactors) {
    EXPECT_EQ(Select({{0, 1}}, Roots(2, 1), 1, 1.0f, 5), Refused(STATUS_MODEL_INCOMPLETE));  // no cluster 5
    const std::regex threeStyles("styles( [01]){3} from( 0){3}");
    const float infinity = std::numeric_limits<float>::infinity(), nan = std::numeric_limits<float>::quiet_NaN();
    for (float factor : {infinity, nan, -3.0f, 1e30f})
        EXPECT_TRUE(std::regex_match(Select({{0, 1}}, Roots(2, 1), 3, factor), threeStyles)) << factor;
}

TEST(OrderClusters, SortsByEuclideanDistance) {
    // From the origin: 10 off in one coordinate, 1 off in all 512, 3 off in four. The sum of
    // differences, the largest difference and the Euclidean distance each give another order.
    Engine engine;
    engine.clusterCentres.assign(3, ClusterCentre{});
    engine.clusterCentres[0][7] = 10.0f;
    engine.clusterCentres[1].fill(1.0f);
    std::fill_n(engine.clusterCentres[2].begin(), 4, -3.0f);
    std::vector<int32_t> order(3, -1);
    EXPECT_EQ(OrderClusters(engine, std::vector<float>(512, 0.0f).data(), order), 0);
    EXPECT_EQ(order, std::vector<int32_t>({2, 0, 1}));
}

}  // namespace
}  // namespace vora
