// The compute operations on small fixture models, through the facade: which
// styles are proposed, and the refusals that come from the model's data.
#include <gtest/gtest.h>

#include <algorithm>
#include <limits>
#include <vector>

#include "api/ApiFixture.h"
#include "transfer/ColourStatistics.h"

namespace vora {
namespace {

using testimages::ImageHandle;

class ComputeDriver : public ApiTest {};

TEST_F(ComputeDriver, ProposalsComeFromTheNearestClusterInScoreOrder) {
    // A uniform image of this colour (R, G, B) lands exactly on centre 2.
    const std::vector<float> feature =
        fixtures::ExpectedFeature(options.network, cv::Mat(256, 256, CV_8UC3, cv::Scalar(40, 90, 200)));
    std::copy_n(feature.begin(), 512, options.centres[2].begin());
    cv::Mat uniform(60, 80, CV_8UC3, cv::Scalar(200, 90, 40));
    const ImageHandle image(uniform);
    params.numTransfers = 3;
    params.rankingFactor = 0.0f;  // no diversity filter: the three best scores
    std::vector<TRANSFER> out(3);
    ASSERT_EQ(Api(options).compute_transfers(image.get(), out, params), STATUS_OK);
    std::vector<float> best = options.scores[2];
    std::sort(best.rbegin(), best.rend());
    for (int i = 0; i < 3; ++i)
        EXPECT_TRUE(out[i].clusterIndex == 2 && options.scores[2].at(out[i].styleIndex) == best[i]) << i;
}

// One ranking column keeps no style: refused, not a hang. Two valid styles per
// cluster, the rest -1: five proposals repeat them.
TEST_F(ComputeDriver, SelectionsWithTooFewStylesEnd) {
    params.numTransfers = 5;
    std::vector<TRANSFER> out(5);
    for (TRANSFER& t : out) t.styleIndex = 777;
    EXPECT_EQ(Api(fixtures::RandomDatabase(2, 1)).compute_transfers(content.get(), out, params),
              STATUS_NO_USABLE_STYLE);
    for (const TRANSFER& t : out) EXPECT_EQ(t.styleIndex, 777);
    ASSERT_EQ(Api(fixtures::RandomDatabase(2, 4)).compute_transfers(content.get(), out, params), STATUS_OK);
    for (int i = 0; i < 5; ++i) EXPECT_EQ(out[i].styleIndex, out[i % 2].styleIndex) << i;
}

// Style records holding NaN or infinity would solve to non-finite transfers:
// both database forms refuse them and leave the caller's records as they were.
TEST_F(ComputeDriver, NonFiniteStyleRecordsGiveNoTransfer) {
    for (const float bad : {std::numeric_limits<float>::quiet_NaN(), std::numeric_limits<float>::infinity()}) {
        fixtures::FixtureOptions database = fixtures::RandomDatabase(2, 4);
        for (ColourStats& style : database.styles) style.chromaSqrtCov[1] = bad;
        const vora_api api = Api(database);
        std::vector<TRANSFER> out(5);
        TRANSFER one;
        for (TRANSFER* t : {&out[0], &out[4], &one}) t->styleIndex = 777;
        EXPECT_EQ(api.compute_transfers(content.get(), out, params), STATUS_NON_FINITE_RESULT);
        EXPECT_EQ(api.compute_transfer(content.get(), 2, one, params), STATUS_NON_FINITE_RESULT);
        for (TRANSFER* t : {&out[0], &out[4], &one}) EXPECT_EQ(t->styleIndex, 777);
    }
}

}  // namespace
}  // namespace vora
