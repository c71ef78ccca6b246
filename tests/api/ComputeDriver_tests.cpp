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

class ComputeDriver : public ApiTest {};

TEST_F(ComputeDriver, ProposalsComeFromTheNearestClusterInScoreOrder) {
    // A uniform image of this colour (R, G, B) lands exactly on centre 2.
    const std::vector<float> feature =
        fixtures::ExpectedFeature(options.network, cv::Mat(256, 256, CV_8UC3, cv::Scalar(40, 90, 200)));
    std::copy_n(feature.begin(), 512, options.centres[2].begin());
    cv::Mat uniform(60, 80, CV_8UC3, cv::Scalar(200, 90, 40));
    const testimages::ImageHandle image(uniform);
    params.numTransfers = 3;
    params.rankingFactor = 0.0f;  // no diversity filter: the three best scores
    std::vector<TRANSFER> out(3);
    ASSERT_EQ(Api(options).compute_transfers(image.get(), out, params), STATUS_OK);
    std::vector<float> best = options.scores[2];
    std::sort(best.rbegin(), best.rend());
    for (int i = 0; i < 3; ++i)
        EXPECT_TRUE(out[i].clusterIndex == 2 && options.scores[2].at(out[i].styleIndex) == best[i]) << i;
}

// Models whose data cannot serve a request are refused, the caller's records
// kept: tables that cannot rank styles (which tables make one is the engine's
// test); one ranking column, which keeps no style (refused, not a hang); and
// style records holding NaN or infinity, which would solve to non-finite
// transfers, in both compute forms.
TEST_F(ComputeDriver, ModelsThatCannotServeAreRefused) {
    fixtures::FixtureOptions broken = options;
    broken.writeDistances = false;
    EXPECT_EQ(Compute(broken), STATUS_MODEL_INCOMPLETE);
    EXPECT_EQ(Compute(fixtures::RandomDatabase(0, 0)), STATUS_MODEL_INCOMPLETE);
    EXPECT_EQ(Compute(fixtures::RandomDatabase(2, 1)), STATUS_NO_USABLE_STYLE);
    for (const float bad : {std::numeric_limits<float>::quiet_NaN(), std::numeric_limits<float>::infinity()}) {
        for (ColourStats& style : options.styles) style.chromaSqrtCov[1] = bad;
        EXPECT_EQ(Compute(options), STATUS_NON_FINITE_RESULT);
        TRANSFER one;
        one.styleIndex = 777;
        EXPECT_EQ(Api(options).compute_transfer(content.get(), 2, one, params), STATUS_NON_FINITE_RESULT);
        EXPECT_EQ(one.styleIndex, 777);
    }
}

}  // namespace
}  // namespace vora
