#include <gtest/gtest.h>

#include <cstring>

#include "model/Engine.h"
#include "model/StyleDatabase.h"
#include "support/ModelFixtures.h"

namespace vora {
namespace {

using fixtures::FixtureOptions;
using fixtures::ModelFixture;

// The three readers in the loader's order, without the network.
ReadResult ReadDatabase(Engine& engine, const std::string& modelDir) {
    ReadClusterCentres(engine, modelDir);
    ReadStyleRecords(engine, DataFilePath(modelDir, kStyleFileName));
    return ReadScoresAndDistances(engine, modelDir);
}

FixtureOptions DataOnly(int clusters, int styles) {
    FixtureOptions options = fixtures::RandomDatabase(clusters, styles, 7);
    options.network.files = fixtures::NetworkOptions::Files::None;
    return options;
}

TEST(StyleDatabase, FileNamesAndJoin) {
    EXPECT_STREQ(kClusterFileName, "semantic_cluster_1000.dat");
    EXPECT_STREQ(kStyleFileName, "styledb_style_1500.dat");
    EXPECT_STREQ(kScoresFileName, "semantic_style_scores_1000_1500_1.dat");
    EXPECT_STREQ(kDistanceFileName, "styledb_fdist_1500.dat");
    EXPECT_EQ(DataFilePath("./model/", kClusterFileName), "./model//semantic_cluster_1000.dat");
    EXPECT_EQ(DataFilePath("C:/data/model", kStyleFileName), "C:/data/model/styledb_style_1500.dat");
}

TEST(StyleDatabase, ReadsEveryTableInFileOrder) {
    const FixtureOptions options = DataOnly(3, 4);
    const ModelFixture model(options);
    Engine engine;
    EXPECT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::Ok);

    ASSERT_EQ(engine.clusterCount, 3);
    ASSERT_EQ(engine.clusterCentres.size(), 3u);
    for (size_t k = 0; k < 3; ++k) EXPECT_EQ(engine.clusterCentres[k], options.centres[k]) << k;

    ASSERT_EQ(engine.styleCount, 4);
    ASSERT_EQ(engine.styleRecords.size(), 4u);
    for (size_t s = 0; s < 4; ++s) {
        EXPECT_EQ(std::memcmp(engine.styleRecords[s].data(), options.styles[s].data(), 38 * sizeof(float)), 0) << s;
        EXPECT_EQ(engine.styleRecords[s].lightnessLow, 0.0f);
        EXPECT_EQ(engine.styleRecords[s].lightnessHigh, 0.0f);
    }

    EXPECT_EQ(engine.scoreColumns, 4);
    ASSERT_EQ(engine.rankedStyles.size(), 3u);
    for (size_t r = 0; r < 3; ++r) {
        const std::vector<float>& scores = options.scores[r];
        const std::vector<int32_t>& ranked = engine.rankedStyles[r];
        ASSERT_EQ(ranked.size(), 4u);
        EXPECT_GT(scores[static_cast<size_t>(ranked[0])], scores[static_cast<size_t>(ranked[1])]);
        for (size_t c = 0; c < 4; ++c) {
            if (c != static_cast<size_t>(ranked[0]) && c != static_cast<size_t>(ranked[1])) {
                EXPECT_GT(scores[static_cast<size_t>(ranked[1])], scores[c]) << r << " " << c;
            }
        }
        EXPECT_EQ(ranked[2], -1);
        EXPECT_EQ(ranked[3], -1);
    }
    EXPECT_EQ(engine.styleDistances, options.distances);
}

TEST(StyleDatabase, OddColumnCountKeepsTheBetterHalfRoundedDown) {
    FixtureOptions options = DataOnly(2, 5);
    options.scores = {{0.1f, 0.9f, 0.5f, 0.7f, 0.3f}, {5.0f, -1.0f, 2.0f, 8.0f, 0.0f}};
    const ModelFixture model(options);
    Engine engine;
    ASSERT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::Ok);
    ASSERT_EQ(engine.rankedStyles.size(), 2u);
    EXPECT_EQ(engine.rankedStyles[0], (std::vector<int32_t>{1, 3, -1, -1, -1}));
    EXPECT_EQ(engine.rankedStyles[1], (std::vector<int32_t>{3, 0, -1, -1, -1}));

    const ModelFixture oneColumn(DataOnly(2, 1));
    Engine oneColumnEngine;
    ASSERT_EQ(ReadDatabase(oneColumnEngine, oneColumn.modelDir()), ReadResult::Ok);
    EXPECT_EQ(oneColumnEngine.rankedStyles, (std::vector<std::vector<int32_t>>{{-1}, {-1}}));
}

TEST(StyleDatabase, TransposedScoresAreRejectedUnlessSquare) {
    FixtureOptions options = DataOnly(2, 3);
    options.transposeScores = true;
    const ModelFixture model(options);
    Engine engine;
    EXPECT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::SizeMismatch);
    EXPECT_EQ(engine.scoreColumns, 2);  // stored as read, even when rejected
    EXPECT_TRUE(engine.rankedStyles.empty());
    EXPECT_TRUE(engine.styleDistances.empty());  // not read after a rejected scores file

    FixtureOptions square = DataOnly(3, 3);
    square.transposeScores = true;
    const ModelFixture squareModel(square);
    Engine squareEngine;
    EXPECT_EQ(ReadDatabase(squareEngine, squareModel.modelDir()), ReadResult::Ok);
    EXPECT_EQ(squareEngine.rankedStyles.size(), 3u);
}

TEST(StyleDatabase, DistancesMirrorTheUpperTriangle) {
    FixtureOptions options = DataOnly(1, 3);
    options.writeDistances = false;
    const ModelFixture model(options);
    fixtures::WriteDistanceFile(model.DataFile(kDistanceFileName), 3, {1.0f, 2.0f, 3.0f, 4.0f, 5.0f, 6.0f});
    Engine engine;
    ASSERT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::Ok);
    const std::vector<std::vector<float>> expected = {{1, 2, 3}, {2, 4, 5}, {3, 5, 6}};
    EXPECT_EQ(engine.styleDistances, expected);
}

TEST(StyleDatabase, DistanceCountMismatchKeepsTheRanking) {
    FixtureOptions options = DataOnly(2, 3);
    options.distanceCount = 2;
    const ModelFixture model(options);
    Engine engine;
    EXPECT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::SizeMismatch);
    EXPECT_TRUE(engine.styleDistances.empty());
    EXPECT_EQ(engine.rankedStyles.size(), 2u);
}

TEST(StyleDatabase, ZeroClustersGiveEmptyTables) {
    const ModelFixture model(DataOnly(0, 3));
    Engine engine;
    EXPECT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::Ok);
    EXPECT_EQ(engine.clusterCount, 0);
    EXPECT_TRUE(engine.clusterCentres.empty());
    EXPECT_TRUE(engine.rankedStyles.empty());
    EXPECT_EQ(engine.styleDistances.size(), 3u);
}

TEST(StyleDatabase, MissingFilesReportCannotOpen) {
    {
        FixtureOptions options = DataOnly(2, 3);
        options.writeClusters = false;
        const ModelFixture model(options);
        Engine engine;
        // The cluster count stays 0, so two score rows no longer fit.
        EXPECT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::SizeMismatch);
        EXPECT_EQ(engine.clusterCount, 0);
        EXPECT_TRUE(engine.clusterCentres.empty());
    }
    {
        FixtureOptions options = DataOnly(2, 3);
        options.writeStyles = false;
        const ModelFixture model(options);
        Engine engine;
        engine.styleCount = 9;
        EXPECT_EQ(ReadStyleRecords(engine, model.DataFile(kStyleFileName)), ReadResult::CannotOpen);
        EXPECT_EQ(engine.styleCount, 9);
    }
    {
        FixtureOptions options = DataOnly(2, 3);
        options.writeScores = false;
        const ModelFixture model(options);
        Engine engine;
        EXPECT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::CannotOpen);
        EXPECT_TRUE(engine.rankedStyles.empty());
        EXPECT_TRUE(engine.styleDistances.empty());  // present, but not read
        EXPECT_EQ(engine.scoreColumns, 0);
    }
    {
        FixtureOptions options = DataOnly(2, 3);
        options.writeDistances = false;
        const ModelFixture model(options);
        Engine engine;
        EXPECT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::CannotOpen);
        EXPECT_EQ(engine.rankedStyles.size(), 2u);
        EXPECT_TRUE(engine.styleDistances.empty());
    }
}

TEST(StyleDatabase, ShortFilesLeaveZeroTails) {
    FixtureOptions options = DataOnly(2, 3);
    options.writeDistances = false;
    const ModelFixture model(options);
    // Cut each file inside its second entry (mid-value, to check byte-wise reads).
    fixtures::TruncateFile(model.DataFile(kClusterFileName), 4 + 2048 + 6);
    fixtures::TruncateFile(model.DataFile(kStyleFileName), 4 + 152 + 10);
    fixtures::TruncateFile(model.DataFile(kScoresFileName), 8 + 4 * 4);
    fixtures::WriteDistanceFile(model.DataFile(kDistanceFileName), 3, {1.0f, 2.0f, 3.0f, 4.0f});

    Engine engine;
    ASSERT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::Ok);
    ASSERT_EQ(engine.clusterCentres.size(), 2u);
    EXPECT_EQ(engine.clusterCentres[0], options.centres[0]);
    EXPECT_EQ(engine.clusterCentres[1][0], options.centres[1][0]);
    float partial = 0.0f;  // the first two bytes from the file, the rest zero
    std::memcpy(&partial, &options.centres[1][1], 2);
    EXPECT_EQ(std::memcmp(&engine.clusterCentres[1][1], &partial, sizeof partial), 0);
    for (size_t i = 2; i < 512; ++i) ASSERT_EQ(engine.clusterCentres[1][i], 0.0f) << i;

    ASSERT_EQ(engine.styleRecords.size(), 3u);
    EXPECT_EQ(engine.styleRecords[1].chromaMean[0], options.styles[1].chromaMean[0]);
    EXPECT_EQ(engine.styleRecords[1].chromaMean[1], options.styles[1].chromaMean[1]);
    EXPECT_EQ(engine.styleRecords[1].chromaSqrtCov[1], 0.0f);
    for (float sample : engine.styleRecords[2].lightness) EXPECT_EQ(sample, 0.0f);

    // Row 0 is read whole; row 1 has only its first value, the rest score 0.
    ASSERT_EQ(engine.rankedStyles.size(), 2u);
    ASSERT_GT(options.scores[1][0], 0.0f);
    EXPECT_EQ(engine.rankedStyles[1], (std::vector<int32_t>{0, -1, -1}));

    const std::vector<std::vector<float>> distances = {{1, 2, 3}, {2, 4, 0}, {3, 0, 0}};
    EXPECT_EQ(engine.styleDistances, distances);
}

TEST(StyleDatabase, NegativeCountsReadAsEmpty) {
    FixtureOptions options = DataOnly(2, 3);
    options.clusterCount = -5;
    options.styleCount = -1;
    const ModelFixture model(options);
    Engine engine;
    EXPECT_EQ(ReadDatabase(engine, model.modelDir()), ReadResult::SizeMismatch);
    EXPECT_EQ(engine.clusterCount, 0);
    EXPECT_TRUE(engine.clusterCentres.empty());
    EXPECT_EQ(engine.styleCount, 0);
    EXPECT_TRUE(engine.styleRecords.empty());

    FixtureOptions negativeScores = DataOnly(2, 3);
    negativeScores.scoreRows = -2;
    negativeScores.scoreColumns = -3;
    const ModelFixture scoresModel(negativeScores);
    Engine scoresEngine;
    EXPECT_EQ(ReadDatabase(scoresEngine, scoresModel.modelDir()), ReadResult::SizeMismatch);
    EXPECT_TRUE(scoresEngine.rankedStyles.empty());
}

TEST(StyleDatabase, OverflowingScoreCountsAreRejectedWithoutAllocating) {
    // Counts that match the engine but whose product leaves int32: no buffer
    // of that size may be attempted.
    FixtureOptions options = DataOnly(0, 0);
    options.scoreRows = 70000;
    options.scoreColumns = 70000;
    const ModelFixture model(options);
    Engine engine;
    engine.clusterCount = 70000;
    engine.styleCount = 70000;
    EXPECT_EQ(ReadScoresAndDistances(engine, model.modelDir()), ReadResult::SizeMismatch);
    EXPECT_TRUE(engine.rankedStyles.empty());
}

}  // namespace
}  // namespace vora
