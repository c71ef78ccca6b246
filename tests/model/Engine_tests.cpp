#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <memory>

#include "model/Engine.h"
#include "model/StyleDatabase.h"
#include "support/ModelFixtures.h"

namespace vora {
namespace {

using fixtures::FixtureOptions;
using fixtures::ModelFixture;
namespace fs = std::filesystem;

TEST(Engine, LoadsFromWhereTheDirectoryStringPointsAndReloads) {
    EXPECT_EQ(DataFilePath("./model/", kScoresFileName), "./model//semantic_style_scores_1000_1500_1.dat");
    const ModelFixture model(fixtures::RandomDatabase(3, 4));
    const fs::path previous = fs::current_path();
    fs::current_path(model.root());
    Engine engine;
    EXPECT_NO_THROW(engine.LoadModel("./model/"));  // data in ./model//, network in ./model/net/
    fs::current_path(previous);
    EXPECT_TRUE(engine.CanRankStyles());

    // "X/m": data in X/m/, network in X/mnet/ (not X/m/net/).
    FixtureOptions options = fixtures::RandomDatabase(2, 3);
    options.trailingSeparator = false;
    const ModelFixture beside(options);
    engine.LoadModel(beside.modelDir());  // over a larger model: loading again replaces every table
    EXPECT_EQ(engine.clusterCentres, options.centres);
    EXPECT_EQ(engine.styleDistances, options.distances);
    EXPECT_TRUE(engine.CanRankStyles());
    fs::rename(beside.root() + "/mnet", beside.root() + "/m/net");
    EXPECT_THROW(Engine().LoadModel(beside.modelDir()), cv::Exception);
}

TEST(Engine, BrokenFilesThrowOrLeaveTablesOutAndLeakNothing) {
    using Files = fixtures::NetworkOptions::Files;
    const std::vector<std::function<void(FixtureOptions&)>> breaks = {
        [](FixtureOptions& o) { o.network.files = Files::None; },
        [](FixtureOptions& o) { o.network.files = Files::MissingDefinition; },
        [](FixtureOptions& o) { o.network.files = Files::MissingWeights; },
        [](FixtureOptions& o) { o.network.files = Files::GarbledDefinition; },
        [](FixtureOptions& o) { o.network.files = Files::GarbledWeights; },
        [](FixtureOptions& o) { o.writeScores = false; },  // teardown with counts beyond the tables
        [](FixtureOptions& o) { o.distanceCount = 2; },
    };
    for (size_t i = 0; i < breaks.size(); ++i) {
        FixtureOptions options = fixtures::RandomDatabase(3, 4);
        breaks[i](options);
        const ModelFixture model(options);
        // Held as the facade holds it; the sanitizer build checks for leaks.
        auto engine = std::make_unique<Engine>();
        if (options.network.files != Files::Valid)
            EXPECT_THROW(engine->LoadModel(model.modelDir()), cv::Exception) << i;
        else
            engine->LoadModel(model.modelDir());
        EXPECT_EQ(engine->clusterCount, 3) << i;  // the data files are read first
        EXPECT_FALSE(engine->CanRankStyles()) << i;
    }
    auto engine = std::make_unique<Engine>();
    engine->clusterCount = 1000;
    engine->styleCount = 1500;
    engine->rankedStyles.assign(2, std::vector<int32_t>(3, -1));
    engine.reset();
}

TEST(Engine, CanRankStylesOnlyWithAgreeingTables) {
    const ModelFixture model(fixtures::RandomDatabase(3, 4));
    const std::vector<std::function<void(Engine&)>> breaks = {
        [](Engine& e) { e.clusterCentres.pop_back(); },
        [](Engine& e) { e.styleRecords.pop_back(); },
        [](Engine& e) { e.rankedStyles.clear(); },
        [](Engine& e) { e.rankedStyles[1].pop_back(); },
        [](Engine& e) { e.scoreColumns = 3; },
        [](Engine& e) { e.styleDistances[2].pop_back(); },
        [](Engine& e) { e.styleDistances.pop_back(); },
        [](Engine& e) { e.clusterCount = e.styleCount = e.scoreColumns = 0; },
        [](Engine& e) { e.network.reset(); },
    };
    for (size_t i = 0; i < breaks.size(); ++i) {
        Engine engine;
        engine.LoadModel(model.modelDir());
        ASSERT_TRUE(engine.CanRankStyles());
        breaks[i](engine);
        EXPECT_FALSE(engine.CanRankStyles()) << i;
    }
}

}  // namespace
}  // namespace vora
