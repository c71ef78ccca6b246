#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <memory>

#include "model/Engine.h"
#include "model/StyleDatabase.h"
#include "support/ModelFixtures.h"

namespace vora {
namespace {

using fixtures::FixtureOptions;
using fixtures::ModelFixture;
using fixtures::RandomDatabase;

// The three readers in the loader's order, without the network; damage may
// alter the written files first. Returns the first failing reader's result.
std::unique_ptr<Engine> Read(const FixtureOptions& options, ReadResult* result,
                             const std::function<void(const ModelFixture&)>& damage = nullptr) {
    const ModelFixture model(options);
    if (damage) damage(model);
    auto engine = std::make_unique<Engine>();
    ReadClusterCentres(*engine, model.modelDir());
    *result = ReadStyleRecords(*engine, model.DataFile(kStyleFileName));
    const ReadResult scores = ReadScoresAndDistances(*engine, model.modelDir());
    if (*result == ReadResult::Ok) *result = scores;
    return engine;
}

TEST(StyleDatabase, ReadsTablesAndKeepsTheBetterHalfOfEachRanking) {
    FixtureOptions options = RandomDatabase(2, 5);
    options.scores = {{0.1f, 0.9f, 0.5f, 0.7f, 0.3f}, {5.0f, -1.0f, 2.0f, 8.0f, 0.0f}};
    ReadResult result;
    const auto engine = Read(options, &result);
    ASSERT_EQ(result, ReadResult::Ok);
    EXPECT_EQ(engine->clusterCentres, options.centres);
    ASSERT_EQ(engine->styleRecords.size(), 5u);  // the percentile words, not in the file, stay zero
    EXPECT_EQ(std::memcmp(engine->styleRecords.data(), options.styles.data(), 5 * sizeof(ColourStats)), 0);
    // C = 5 keeps 2 by decreasing score; the other 3 hold -1.
    EXPECT_EQ(engine->rankedStyles, (std::vector<std::vector<int32_t>>{{1, 3, -1, -1, -1}, {3, 0, -1, -1, -1}}));
    EXPECT_EQ(engine->styleDistances, options.distances);  // written as the upper triangle only

    const auto oneColumn = Read(RandomDatabase(2, 1), &result);
    EXPECT_EQ(oneColumn->rankedStyles, (std::vector<std::vector<int32_t>>{{-1}, {-1}}));
}

struct ReaderCase {
    const char* name;
    std::function<void(FixtureOptions&)> change;
    ReadResult result;
    size_t centres, styles, ranked, distances;
    int32_t scoreColumns;
};

TEST(StyleDatabase, MissingOrMismatchedFilesLeaveTablesEmpty) {
    const std::vector<ReaderCase> cases = {
        {"consistent", nullptr, ReadResult::Ok, 2, 3, 2, 3, 3},
        {"no clusters", [](FixtureOptions& o) { o.writeClusters = false; }, ReadResult::SizeMismatch, 0, 3, 0, 0, 3},
        {"no styles", [](FixtureOptions& o) { o.writeStyles = false; }, ReadResult::CannotOpen, 2, 0, 0, 0, 3},
        {"no scores", [](FixtureOptions& o) { o.writeScores = false; }, ReadResult::CannotOpen, 2, 3, 0, 0, 0},
        {"no distances", [](FixtureOptions& o) { o.writeDistances = false; }, ReadResult::CannotOpen, 2, 3, 2, 0, 3},
        {"distance count", [](FixtureOptions& o) { o.distanceCount = 2; }, ReadResult::SizeMismatch, 2, 3, 2, 0, 3},
        // Swapped R and C are rejected (the columns stored as read) unless square.
        {"transposed", [](FixtureOptions& o) { o.transposeScores = true; }, ReadResult::SizeMismatch, 2, 3, 0, 0, 2},
        {"transposed square", [](FixtureOptions& o) { o = RandomDatabase(3, 3), o.transposeScores = true; },
         ReadResult::Ok, 3, 3, 3, 3, 3},
        {"no clusters at all", [](FixtureOptions& o) { o = RandomDatabase(0, 3); }, ReadResult::Ok, 0, 3, 0, 3, 3},
        {"negative table counts", [](FixtureOptions& o) { o.clusterCount = -5, o.styleCount = -1; },
         ReadResult::SizeMismatch, 0, 0, 0, 0, 3},
        {"negative score counts", [](FixtureOptions& o) { o.scoreRows = -2, o.scoreColumns = -3; },
         ReadResult::SizeMismatch, 2, 3, 0, 0, -3},
    };
    for (const ReaderCase& c : cases) {
        SCOPED_TRACE(c.name);
        FixtureOptions options = RandomDatabase(2, 3);
        if (c.change) c.change(options);
        ReadResult result;
        const auto engine = Read(options, &result);
        EXPECT_EQ(result, c.result);
        EXPECT_EQ(engine->clusterCentres.size(), c.centres);
        EXPECT_EQ(engine->clusterCount, static_cast<int32_t>(c.centres));
        EXPECT_EQ(engine->styleRecords.size(), c.styles);
        EXPECT_EQ(engine->styleCount, static_cast<int32_t>(c.styles));
        EXPECT_EQ(engine->rankedStyles.size(), c.ranked);
        EXPECT_EQ(engine->styleDistances.size(), c.distances);
        EXPECT_EQ(engine->scoreColumns, c.scoreColumns);
    }
}

// The table's first bytes, then zeros.
template <typename Table>
Table KeepBytes(Table table, size_t bytes) {
    std::memset(reinterpret_cast<char*>(table.data()) + bytes, 0, table.size() * sizeof table[0] - bytes);
    return table;
}

TEST(StyleDatabase, ShortFilesLeaveZeroTails) {
    const FixtureOptions options = RandomDatabase(2, 3);
    ReadResult result;
    // Each file cut inside its second entry, mid-value to check byte-wise reads.
    const auto engine = Read(options, &result, [](const ModelFixture& model) {
        fixtures::TruncateFile(model.DataFile(kClusterFileName), 4 + 2048 + 6);
        fixtures::TruncateFile(model.DataFile(kStyleFileName), 4 + 152 + 10);
        fixtures::TruncateFile(model.DataFile(kScoresFileName), 8 + 4 * 4);
        fixtures::WriteDataFile(model.DataFile(kDistanceFileName), {3}, {1, 2, 3, 4});
    });
    ASSERT_EQ(result, ReadResult::Ok);
    ASSERT_EQ(engine->clusterCentres.size(), 2u);
    ASSERT_EQ(engine->styleRecords.size(), 3u);
    const auto centres = KeepBytes(options.centres, 2048 + 6);
    EXPECT_EQ(std::memcmp(engine->clusterCentres.data(), centres.data(), 2 * sizeof(ClusterCentre)), 0);
    const auto styles = KeepBytes(options.styles, sizeof(ColourStats) + 10);  // the percentile words are zero
    EXPECT_EQ(std::memcmp(engine->styleRecords.data(), styles.data(), 3 * sizeof(ColourStats)), 0);
    // Row 1 has only its first (positive) score; the rest score 0.
    ASSERT_GT(options.scores[1][0], 0.0f);
    EXPECT_EQ(engine->rankedStyles.at(1), (std::vector<int32_t>{0, -1, -1}));
    // The upper triangle mirrored: (a b c)(b d e)(c e f), its missing tail zero.
    EXPECT_EQ(engine->styleDistances, (std::vector<std::vector<float>>{{1, 2, 3}, {2, 4, 0}, {3, 0, 0}}));
}

TEST(StyleDatabase, OverflowingScoreCountsAreRejectedWithoutAllocating) {
    // Counts that match the engine but whose product leaves int32.
    FixtureOptions options = RandomDatabase(0, 0);
    options.scoreRows = options.scoreColumns = 70000;
    const ModelFixture model(options);
    Engine engine;
    engine.clusterCount = engine.styleCount = 70000;
    EXPECT_EQ(ReadScoresAndDistances(engine, model.modelDir()), ReadResult::SizeMismatch);
    EXPECT_TRUE(engine.rankedStyles.empty());
}

}  // namespace
}  // namespace vora
