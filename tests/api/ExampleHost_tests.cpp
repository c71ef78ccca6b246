// The example host, run as a host would run it, renders exactly what the
// library renders in-process.
#include <gtest/gtest.h>

#include <cstdlib>
#include <string>

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include <vora/vora.h>

#include "support/ModelFixtures.h"
#include "support/TestImages.h"

namespace vora {
namespace {

TEST(ExampleHost, RendersTheFirstProposalTileByTile) {
    fixtures::ModelFixture model(fixtures::RandomDatabase(3, 12));
    cv::Mat rgb = testimages::SyntheticPhotoRgb(150, 210);
    const std::string photoPath = model.root() + "/photo.png";
    const std::string outPath = model.root() + "/out.png";
    cv::Mat bgr;
    cv::cvtColor(rgb, bgr, cv::COLOR_RGB2BGR);
    ASSERT_TRUE(cv::imwrite(photoPath, bgr));

    const std::string command = std::string(VORA_EXAMPLE_HOST) + " '" + model.modelDir() + "' '" + photoPath +
                                "' '" + outPath + "' 37 > /dev/null";
    ASSERT_EQ(std::system(command.c_str()), 0);
    const cv::Mat written = cv::imread(outPath, cv::IMREAD_COLOR);
    ASSERT_FALSE(written.empty());

    vora_api api(model.modelDir());
    testimages::ImageHandle photo(rgb);
    VoraParameters params;
    params.numTransfers = 3;
    std::vector<TRANSFER> proposals(3);
    ASSERT_EQ(api.compute_transfers(photo.get(), proposals, params), STATUS_OK);
    ASSERT_EQ(api.apply_transfer(photo.get(), proposals[0], photo.get()), STATUS_OK);
    cv::cvtColor(rgb, bgr, cv::COLOR_RGB2BGR);
    EXPECT_EQ(cv::norm(written, bgr, cv::NORM_INF), 0.0);
}

TEST(ExampleHost, ReportsAMissingPhoto) {
    fixtures::ModelFixture model(fixtures::RandomDatabase(2, 4));
    const std::string command = std::string(VORA_EXAMPLE_HOST) + " '" + model.modelDir() + "' '" + model.root() +
                                "/absent.png' '" + model.root() + "/out.png' 2> /dev/null";
    EXPECT_NE(std::system(command.c_str()), 0);
}

}  // namespace
}  // namespace vora
