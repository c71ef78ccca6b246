#include <gtest/gtest.h>

#include <filesystem>
#include <memory>

#include "model/Engine.h"
#include "model/StyleDatabase.h"
#include "support/ModelFixtures.h"

namespace vora {
namespace {

using fixtures::FixtureOptions;
using fixtures::ModelFixture;
using fixtures::NetworkOptions;

// Runs body with the working folder set to folder, and restores it.
template <typename Body>
void InFolder(const std::string& folder, Body body) {
    const std::filesystem::path previous = std::filesystem::current_path();
    std::filesystem::current_path(folder);
    try {
        body();
    } catch (...) {
        std::filesystem::current_path(previous);
        throw;
    }
    std::filesystem::current_path(previous);
}

TEST(Engine, LoadsTheDefaultRelativeDirectory) {
    const ModelFixture model(fixtures::RandomDatabase(3, 4));
    ASSERT_EQ(model.modelDir(), model.root() + "/model/");
    Engine engine;
    InFolder(model.root(), [&] { EXPECT_EQ(engine.LoadModel("./model/"), 0); });
    EXPECT_EQ(engine.clusterCount, 3);
    EXPECT_EQ(engine.styleCount, 4);
    EXPECT_EQ(engine.rankedStyles.size(), 3u);
    EXPECT_EQ(engine.styleDistances.size(), 4u);
    ASSERT_NE(engine.network, nullptr);
    EXPECT_TRUE(engine.network->hasMemoryDataInput());
    EXPECT_TRUE(engine.CanRankStyles());
}

TEST(Engine, DirectoryWithoutSeparatorTakesTheNetworkBesideIt) {
    FixtureOptions options = fixtures::RandomDatabase(2, 3);
    options.trailingSeparator = false;
    const ModelFixture model(options);
    ASSERT_EQ(model.modelDir(), model.root() + "/m");
    ASSERT_TRUE(std::filesystem::exists(model.root() + "/mnet/deploy2.prototxt"));
    Engine engine;
    EXPECT_EQ(engine.LoadModel(model.modelDir()), 0);
    EXPECT_TRUE(engine.CanRankStyles());

    // With the network inside the directory instead, it is not found.
    std::filesystem::rename(model.root() + "/mnet", model.root() + "/m/net");
    Engine misplaced;
    EXPECT_THROW(misplaced.LoadModel(model.modelDir()), cv::Exception);
    EXPECT_EQ(misplaced.clusterCount, 2);  // the data files were read first
}

TEST(Engine, MissingNetworkThrowsAfterTheDataAndLeaksNothing) {
    using Files = NetworkOptions::Files;
    for (Files kind : {Files::None, Files::MissingDefinition, Files::MissingWeights, Files::GarbledDefinition,
                       Files::GarbledWeights}) {
        FixtureOptions options = fixtures::RandomDatabase(2, 3);
        options.network.files = kind;
        const ModelFixture model(options);
        // Held as the facade holds it; the sanitizer build checks for leaks.
        auto engine = std::make_unique<Engine>();
        EXPECT_THROW(engine->LoadModel(model.modelDir()), cv::Exception) << static_cast<int>(kind);
        EXPECT_EQ(engine->rankedStyles.size(), 2u);
        EXPECT_EQ(engine->network, nullptr);
        EXPECT_FALSE(engine->CanRankStyles());
    }
}

TEST(Engine, TeardownToleratesTablesShorterThanTheCounts) {
    FixtureOptions noScores = fixtures::RandomDatabase(3, 4);
    noScores.writeScores = false;
    const ModelFixture noScoresModel(noScores);
    auto engine = std::make_unique<Engine>();
    engine->LoadModel(noScoresModel.modelDir());
    EXPECT_EQ(engine->clusterCount, 3);
    EXPECT_TRUE(engine->rankedStyles.empty());
    EXPECT_TRUE(engine->styleDistances.empty());
    EXPECT_FALSE(engine->CanRankStyles());
    engine.reset();

    FixtureOptions badDistances = fixtures::RandomDatabase(3, 4);
    badDistances.distanceCount = 2;
    const ModelFixture badDistancesModel(badDistances);
    engine = std::make_unique<Engine>();
    engine->LoadModel(badDistancesModel.modelDir());
    EXPECT_EQ(engine->styleCount, 4);
    EXPECT_TRUE(engine->styleDistances.empty());
    EXPECT_FALSE(engine->CanRankStyles());
    engine.reset();

    // Counts far beyond the tables.
    engine = std::make_unique<Engine>();
    engine->clusterCount = 1000;
    engine->styleCount = 1500;
    engine->rankedStyles.assign(2, std::vector<int32_t>(3, -1));
    engine.reset();
}

TEST(Engine, CanRankStylesOnlyWithAgreeingTables) {
    const ModelFixture model(fixtures::RandomDatabase(3, 4));
    Engine engine;
    engine.LoadModel(model.modelDir());
    ASSERT_TRUE(engine.CanRankStyles());
    const Engine& loaded = engine;
    auto stillRanks = [&](void (*change)(Engine&)) {
        Engine copy;
        copy.clusterCentres = loaded.clusterCentres;
        copy.rankedStyles = loaded.rankedStyles;
        copy.styleRecords = loaded.styleRecords;
        copy.styleDistances = loaded.styleDistances;
        copy.clusterCount = loaded.clusterCount;
        copy.styleCount = loaded.styleCount;
        copy.scoreColumns = loaded.scoreColumns;
        copy.network = std::move(engine.network);
        change(copy);
        const bool ranks = copy.CanRankStyles();
        engine.network = std::move(copy.network);
        return ranks;
    };
    EXPECT_TRUE(stillRanks([](Engine&) {}));
    EXPECT_FALSE(stillRanks([](Engine& e) { e.clusterCentres.pop_back(); }));
    EXPECT_FALSE(stillRanks([](Engine& e) { e.styleRecords.pop_back(); }));
    EXPECT_FALSE(stillRanks([](Engine& e) { e.rankedStyles.clear(); }));
    EXPECT_FALSE(stillRanks([](Engine& e) { e.rankedStyles[1].pop_back(); }));
    EXPECT_FALSE(stillRanks([](Engine& e) { e.scoreColumns = 3; }));
    EXPECT_FALSE(stillRanks([](Engine& e) { e.styleDistances[2].pop_back(); }));
    EXPECT_FALSE(stillRanks([](Engine& e) { e.clusterCount = e.styleCount = e.scoreColumns = 0; }));
    EXPECT_FALSE(stillRanks([](Engine& e) { e.network.reset(); }));  // last: the network is gone afterwards
}

TEST(Engine, LoadingAgainReplacesTheTables) {
    const ModelFixture large(fixtures::RandomDatabase(3, 4, 1));
    const ModelFixture small(fixtures::RandomDatabase(2, 2, 2));
    Engine engine;
    engine.LoadModel(large.modelDir());
    engine.LoadModel(small.modelDir());
    EXPECT_EQ(engine.clusterCentres.size(), 2u);
    EXPECT_EQ(engine.clusterCentres[1], small.options().centres[1]);
    EXPECT_EQ(engine.styleRecords.size(), 2u);
    EXPECT_EQ(engine.rankedStyles.size(), 2u);
    EXPECT_EQ(engine.styleDistances, small.options().distances);
    EXPECT_TRUE(engine.CanRankStyles());
}

}  // namespace
}  // namespace vora
