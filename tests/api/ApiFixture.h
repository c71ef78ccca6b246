#pragma once

// The api tests' common ground: a random fixture database, a synthetic photo,
// default parameters and a compute run that checks a refusal writes nothing.
#include <gtest/gtest.h>

#include <opencv2/core.hpp>

#include <vora/vora.h>

#include "support/ModelFixtures.h"
#include "support/TestImages.h"

namespace vora {

class ApiTest : public testing::Test {
protected:
    fixtures::FixtureOptions options = fixtures::RandomDatabase(4, 16);
    cv::Mat photo = testimages::SyntheticPhotoRgb(120, 160);
    testimages::ImageHandle content{photo};
    VoraParameters params;

    // The model is read whole at construction, so its folder may go afterwards.
    static vora_api Api(const fixtures::FixtureOptions& options) {
        const fixtures::ModelFixture model(options);
        return vora_api(model.modelDir());
    }

    // Runs compute_transfers into a vector of n + 1 marked records: a refusal leaves every mark.
    Status Compute(const fixtures::FixtureOptions& database, uint64_t n = 5) {
        vora_api api = Api(database);
        params.numTransfers = n;
        std::vector<TRANSFER> out(n + 1);
        for (TRANSFER& t : out) t.styleIndex = 777;
        const Status status = api.compute_transfers(content.get(), out, params);
        for (const TRANSFER& t : out) EXPECT_TRUE(status == STATUS_OK || t.styleIndex == 777);
        return status;
    }
};

}  // namespace vora
