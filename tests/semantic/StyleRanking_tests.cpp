#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <vector>

#include "model/Engine.h"
#include "semantic/StyleRanking.h"

namespace vora {
namespace {

// An engine with one cluster per ranking row and a chosen distance matrix
// (stored as squared "Lab" distances, as the selection takes their root).
class Ranking : public testing::Test {
protected:
    void SetTables(std::vector<std::vector<int32_t>> ranking, std::vector<std::vector<float>> distances) {
        engine.rankedStyles = std::move(ranking);
        engine.styleDistances = std::move(distances);
        engine.clusterCount = static_cast<int32_t>(engine.rankedStyles.size());
        engine.styleCount = static_cast<int32_t>(engine.styleDistances.size());
        engine.scoreColumns = engine.styleCount;
        engine.clusterCentres.assign(engine.rankedStyles.size(), ClusterCentre{});
    }

    Status Select(uint64_t n, float factor, int32_t nearest = 0) {
        VoraParameters params;
        params.numTransfers = n;
        params.rankingFactor = factor;
        return SelectStyles(engine, ColourStats{}, {nearest}, clusters, styles, params);
    }

    // Squared distances: root d(i, j) given by the caller.
    static std::vector<std::vector<float>> Squared(const std::vector<std::vector<float>>& roots) {
        std::vector<std::vector<float>> out = roots;
        for (auto& row : out)
            for (float& v : row) v = v * v;
        return out;
    }

    Engine engine;
    std::vector<int32_t> clusters;
    std::vector<int32_t> styles;
};

TEST_F(Ranking, OneStyleIsTheBestScoredWhateverTheFactor) {
    SetTables({{3, 1, -1, -1}}, Squared({{0, 1, 1, 1}, {1, 0, 1, 1}, {1, 1, 0, 1}, {1, 1, 1, 0}}));
    for (float factor : {0.0f, 1.0f, 100.0f}) {
        ASSERT_EQ(Select(1, factor), STATUS_OK);
        EXPECT_EQ(styles, std::vector<int32_t>({3}));
        EXPECT_EQ(clusters, std::vector<int32_t>({0}));
    }
}

TEST_F(Ranking, ZeroFactorTakesTheFirstValidPositionsInScoreOrder) {
    SetTables({{2, -1, 0, 1}}, Squared({{0, 1, 1, 1}, {1, 0, 1, 1}, {1, 1, 0, 1}, {1, 1, 1, 0}}));
    ASSERT_EQ(Select(3, 0.0f), STATUS_OK);
    EXPECT_EQ(styles, std::vector<int32_t>({2, 0, 1}));
}

TEST_F(Ranking, DiversityFilterSkipsCloseStyles) {
    // Style 1 is 5 from style 0, style 2 is 20 from both: with t = 15 the
    // second choice skips 1.
    SetTables({{0, 1, 2}}, Squared({{0, 5, 20}, {5, 0, 20}, {20, 20, 0}}));
    ASSERT_EQ(Select(2, 1.0f), STATUS_OK);
    EXPECT_EQ(styles, std::vector<int32_t>({0, 2}));
}

TEST_F(Ranking, RelaxesUntilEnoughStylesPass) {
    // All roots below 15. t runs 15 -> 12 -> 9.6: at 12 neither style 2
    // (root 9 to style 0) nor style 1 (root 10) passes; at 9.6 style 2 still
    // fails and style 1 passes, though it scores below style 2.
    SetTables({{0, 2, 1}}, Squared({{0, 10, 9}, {10, 0, 12}, {9, 12, 0}}));
    ASSERT_EQ(Select(2, 1.0f), STATUS_OK);
    EXPECT_EQ(styles, std::vector<int32_t>({0, 1}));
}

TEST_F(Ranking, RepeatsStylesWhenTooFewCanPass) {
    SetTables({{1, 0, -1, -1}}, Squared({{0, 30, 30, 30}, {30, 0, 30, 30}, {30, 30, 0, 30}, {30, 30, 30, 0}}));
    ASSERT_EQ(Select(4, 1.0f), STATUS_OK);
    ASSERT_EQ(styles.size(), 4u);
    EXPECT_EQ(styles[0], 1);
    EXPECT_EQ(styles[1], 0);
    // Only two valid entries: once the threshold has shrunk to 0 the chosen
    // ones are accepted again, in scan order.
    EXPECT_EQ(styles[2], 1);
    EXPECT_EQ(styles[3], 0);
}

TEST_F(Ranking, OnlyTheNearestClusterIsConsulted) {
    SetTables({{0, 1, -1}, {2, 1, -1}}, Squared({{0, 20, 20}, {20, 0, 20}, {20, 20, 0}}));
    ASSERT_EQ(Select(2, 1.0f, 1), STATUS_OK);
    EXPECT_EQ(styles, std::vector<int32_t>({2, 1}));
    EXPECT_EQ(clusters, std::vector<int32_t>({1, 1}));
}

TEST_F(Ranking, RefusesSelectionsThatCouldNeverFinish) {
    SetTables({{-1, -1}}, Squared({{0, 1}, {1, 0}}));
    EXPECT_EQ(Select(2, 1.0f), STATUS_NO_USABLE_STYLE);
    EXPECT_EQ(Select(0, 1.0f), STATUS_NO_TRANSFERS_REQUESTED);
    EXPECT_EQ(Select(1, 1.0f, 5), STATUS_MODEL_INCOMPLETE);  // cluster outside the table
    EXPECT_TRUE(styles.empty());
}

TEST_F(Ranking, ExtremeFactorsStillFinish) {
    SetTables({{0, 1}}, Squared({{0, 1}, {1, 0}}));
    for (float factor : {std::numeric_limits<float>::infinity(), std::numeric_limits<float>::quiet_NaN(),
                         -3.0f, 1e30f}) {
        ASSERT_EQ(Select(3, factor), STATUS_OK) << factor;
        EXPECT_EQ(styles.size(), 3u);
    }
}

TEST(OrderClusters, SortsByEuclideanDistance) {
    Engine engine;
    engine.clusterCentres.assign(3, ClusterCentre{});
    engine.clusterCentres[0].fill(3.0f);
    engine.clusterCentres[1].fill(1.0f);
    engine.clusterCentres[2].fill(-2.0f);
    std::vector<float> feature(512, 0.5f);
    std::vector<int32_t> order(3, -1);
    EXPECT_EQ(OrderClusters(engine, feature.data(), order), 0);
    EXPECT_EQ(order, std::vector<int32_t>({1, 0, 2}));
}

}  // namespace
}  // namespace vora
