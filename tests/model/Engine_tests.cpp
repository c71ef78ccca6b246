#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <string>

#include "model/Engine.h"
#include "support/ModelFixtures.h"

namespace vora {
namespace {

using fixtures::FixtureOptions;
using fixtures::ModelFixture;
namespace fs = std::filesystem;

// "X/m": data in X/m/, network in X/mnet/ (not X/m/net/). The facade's default
// constructor covers "./model/" (data in ./model//, network in ./model/net/).
TEST(Engine, LoadsFromWhereTheDirectoryStringPointsAndReloads) {
    const ModelFixture larger(fixtures::RandomDatabase(3, 4));
    Engine engine;
    engine.LoadModel(larger.modelDir());
    const FixtureOptions options = fixtures::RandomDatabase(2, 3);
    const ModelFixture model(options);
    const std::string m = model.root() + "/m";
    fs::rename(model.modelDir(), m);
    fs::rename(m + "/net", m + "net");
    engine.LoadModel(m);  // loading again replaces every table
    EXPECT_EQ(engine.clusterCentres, options.centres);
    EXPECT_EQ(engine.styleDistances, options.distances);
    EXPECT_TRUE(engine.CanRankStyles());
    fs::rename(m + "net", m + "/net");
    EXPECT_THROW(Engine().LoadModel(m), cv::Exception);
}

// Each break leaves a loaded model without its network or with tables that
// disagree; an empty model is refused at the facade
// (ComputeDriver.ModelsThatCannotServeAreRefused).
TEST(Engine, CanRankStylesOnlyWithAgreeingTables) {
    const ModelFixture model(fixtures::RandomDatabase(3, 4));
    const std::vector<std::function<void(Engine&)>> breaks = {
        [](Engine& e) { e.clusterCentres.pop_back(); }, [](Engine& e) { e.styleRecords.pop_back(); },
        [](Engine& e) { e.rankedStyles.clear(); }, [](Engine& e) { e.rankedStyles[1].pop_back(); },
        [](Engine& e) { e.scoreColumns = 3; }, [](Engine& e) { e.network.reset(); },
        [](Engine& e) { e.styleDistances[2].pop_back(); }, [](Engine& e) { e.styleDistances.pop_back(); },
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
