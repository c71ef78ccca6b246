#pragma once

// The api tests' common ground: a random fixture database, a synthetic photo
// and default parameters.
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
};

}  // namespace vora
