#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <memory>
#include <string>
#include <tuple>
#include <utility>

#include "model/Engine.h"
#include "model/StyleDatabase.h"
#include "support/ModelFixtures.h"

namespace vora {
namespace {

using fixtures::FixtureOptions;
using fixtures::ModelFixture;
using fixtures::RandomDatabase;

// The three readers in the loader's order, without the network; damage may
// alter the written files first. Gives the first failing reader's result.
std::pair<std::unique_ptr<Engine>, ReadResult> Read(const FixtureOptions& options,
                                                    const std::function<void(const ModelFixture&)>& damage = nullptr) {
    const ModelFixture model(options);
    if (damage) damage(model);
    auto engine = std::make_unique<Engine>();
    ReadClusterCentres(*engine, model.modelDir());
    const ReadResult styles = ReadStyleRecords(*engine, model.DataFile(kStyleFileName));
    const ReadResult scores = ReadScoresAndDistances(*engine, model.modelDir());
    return {std::move(engine), styles == ReadResult::Ok ? scores : styles};
}

// A table's bytes; with keep, its first keep bytes and zeros after them.
template <typename Table>
std::string Bytes(const Table& table, size_t keep = std::string::npos) {
    std::string bytes(reinterpret_cast<const char*>(table.data()), table.size() * sizeof table[0]);
    if (keep < bytes.size()) std::fill(bytes.begin() + static_cast<long>(keep), bytes.end(), '\0');
    return bytes;
}

TEST(StyleDatabase, ReadsTablesAndKeepsTheBetterHalfOfEachRanking) {
    FixtureOptions options = RandomDatabase(2, 5);
    options.scores = {{0.1f, 0.9f, 0.5f, 0.7f, 0.3f}, {5.0f, -1.0f, 2.0f, 8.0f, 0.0f}};
    const auto [engine, result] = Read(options);
    ASSERT_EQ(result, ReadResult::Ok);  // the tables' bytes and mirrored distances: ShortFilesLeaveZeroTails
    // C = 5 keeps 2 by decreasing score; the other 3 hold -1.
    EXPECT_EQ(engine->rankedStyles, (std::vector<std::vector<int32_t>>{{1, 3, -1, -1, -1}, {3, 0, -1, -1, -1}}));
}

TEST(StyleDatabase, MissingOrMismatchedFilesLeaveTablesEmpty) {
    using Change = std::function<void(FixtureOptions&)>;
    // Per case: the result, then the sizes of centres, styles, ranking, distances and the score column count.
    const std::vector<std::tuple<const char*, Change, ReadResult, std::vector<int64_t>>> cases = {
        {"no clusters", [](FixtureOptions& o) { o.writeClusters = false; }, ReadResult::SizeMismatch, {0, 3, 0, 0, 3}},
        {"no styles", [](FixtureOptions& o) { o.writeStyles = false; }, ReadResult::CannotOpen, {2, 0, 0, 0, 3}},
        {"no scores", [](FixtureOptions& o) { o.writeScores = false; }, ReadResult::CannotOpen, {2, 3, 0, 0, 0}},
        {"no distances", [](FixtureOptions& o) { o.writeDistances = false; }, ReadResult::CannotOpen, {2, 3, 2, 0, 3}},
        {"distance count", [](FixtureOptions& o) { o.distanceCount = 2; }, ReadResult::SizeMismatch, {2, 3, 2, 0, 3}},
        // Swapped R and C are rejected, the columns stored as read.
        {"transposed", [](FixtureOptions& o) { o.transposeScores = true; }, ReadResult::SizeMismatch, {2, 3, 0, 0, 2}},
        {"negative table counts", [](FixtureOptions& o) { o.clusterCount = -5, o.styleCount = -1; },
         ReadResult::SizeMismatch, {0, 0, 0, 0, 3}},
        {"negative score counts", [](FixtureOptions& o) { o.scoreRows = -2, o.scoreColumns = -3; },
         ReadResult::SizeMismatch, {2, 3, 0, 0, -3}},
        // Refused before allocating: the file cannot stand for 2 GB of centres.
        {"a million clusters", [](FixtureOptions& o) { o.clusterCount = 1000000; }, ReadResult::SizeMismatch,
         {0, 3, 0, 0, 3}},
    };
    for (const auto& [name, change, expected, sizes] : cases) {
        FixtureOptions options = RandomDatabase(2, 3);
        change(options);
        const auto [e, result] = Read(options);
        EXPECT_EQ(result, expected) << name;
        const auto size = [](const auto& table) { return static_cast<int64_t>(table.size()); };
        EXPECT_EQ((std::vector<int64_t>{e->clusterCount, e->styleCount, size(e->rankedStyles), size(e->styleDistances),
                                        e->scoreColumns}), sizes) << name;
        EXPECT_TRUE(size(e->clusterCentres) == e->clusterCount && size(e->styleRecords) == e->styleCount) << name;
    }
}

TEST(StyleDatabase, ShortFilesLeaveZeroTails) {
    const FixtureOptions options = RandomDatabase(2, 3);
    // Each file cut inside its second entry, mid-value to check byte-wise reads.
    const auto [engine, result] = Read(options, [](const ModelFixture& model) {
        fixtures::TruncateFile(model.DataFile(kClusterFileName), 4 + 2048 + 6);
        fixtures::TruncateFile(model.DataFile(kStyleFileName), 4 + 152 + 10);
        fixtures::TruncateFile(model.DataFile(kScoresFileName), 8 + 4 * 4);
        fixtures::WriteDataFile(model.DataFile(kDistanceFileName), {3}, {1, 2, 3, 4});
    });
    ASSERT_EQ(result, ReadResult::Ok);
    EXPECT_EQ(Bytes(engine->clusterCentres), Bytes(options.centres, 2048 + 6));
    // Percentile words are not in the file and stay zero, as in the fixture's records.
    EXPECT_EQ(Bytes(engine->styleRecords), Bytes(options.styles, sizeof(ColourStats) + 10));
    // Row 1 has only its first (positive) score; the rest score 0.
    ASSERT_GT(options.scores[1][0], 0.0f);
    EXPECT_EQ(engine->rankedStyles.at(1), (std::vector<int32_t>{0, -1, -1}));
    // The upper triangle mirrored: (a b c)(b d e)(c e f), its missing tail zero.
    EXPECT_EQ(engine->styleDistances, (std::vector<std::vector<float>>{{1, 2, 3}, {2, 4, 0}, {3, 0, 0}}));
}

// Counts a small file cannot stand for are refused before anything is
// allocated (a million clusters: MissingOrMismatchedFilesLeaveTablesEmpty): a
// partial header, four agreeing headers of 15,000 (which cost 3 GB and 103 s),
// and score counts that agree with the engine but whose product leaves int32.
TEST(StyleDatabase, CountsBeyondTheFileAreRefusedBeforeAllocating) {
    const auto [partial, partialResult] = Read(RandomDatabase(2, 3), [](const ModelFixture& model) {
        fixtures::WriteBytes(model.DataFile(kClusterFileName), std::string("\xff\xff\x7f", 3));
    });
    EXPECT_TRUE(partial->clusterCount == 0 && partial->clusterCentres.empty());

    FixtureOptions agreeing = RandomDatabase(0, 0);
    agreeing.clusterCount = agreeing.styleCount = agreeing.scoreRows = agreeing.scoreColumns =
        agreeing.distanceCount = 15000;
    const auto [engine, result] = Read(agreeing);
    EXPECT_EQ(result, ReadResult::SizeMismatch);
    EXPECT_TRUE(engine->clusterCentres.empty() && engine->rankedStyles.empty() && engine->styleDistances.empty());

    agreeing.scoreRows = agreeing.scoreColumns = 70000;
    const ModelFixture overflowing(agreeing);
    Engine counted;
    counted.clusterCount = counted.styleCount = 70000;
    EXPECT_EQ(ReadScoresAndDistances(counted, overflowing.modelDir()), ReadResult::SizeMismatch);
    EXPECT_TRUE(counted.rankedStyles.empty());
}

}  // namespace
}  // namespace vora
