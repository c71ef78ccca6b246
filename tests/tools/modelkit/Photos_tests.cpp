#include "modelkit/Photos.h"

#include <gtest/gtest.h>

using namespace vora::modelkit;

TEST(Photos, PhotographRuleSkipsSmallAndTransparentImages) {
    cv::Mat opaque(500, 500, CV_8UC4, cv::Scalar(1, 2, 3, 255));
    EXPECT_TRUE(LooksLikePhotograph(opaque));
    opaque.at<cv::Vec4b>(499, 499)[3] = 254;  // one cut-out pixel
    EXPECT_FALSE(LooksLikePhotograph(opaque));
    EXPECT_TRUE(LooksLikePhotograph(cv::Mat(400, 600, CV_8UC3, cv::Scalar::all(9))));
    for (int type : {CV_8UC1, CV_16UC3}) EXPECT_FALSE(LooksLikePhotograph(cv::Mat(500, 500, type, cv::Scalar::all(9))));
    EXPECT_FALSE(LooksLikePhotograph(cv::Mat(399, 600, CV_8UC3, cv::Scalar::all(9))));
}

TEST(Photos, AlterationsChangeWhatTheySay) {
    cv::Mat photo(101, 250, CV_8UC3);
    cv::randu(photo, 0, 256);
    photo.at<cv::Vec3b>(0, 0) = cv::Vec3b(240, 100, 10);
    const cv::Mat crop = Alter(photo, Alteration::Crop80);
    EXPECT_EQ(cv::norm(crop, photo(cv::Rect(25, 10, 200, 81)), cv::NORM_INF), 0.0);
    EXPECT_EQ(Alter(photo, Alteration::HalfSize).size(), cv::Size(125, 51));
    EXPECT_EQ(Alter(photo, Alteration::Brighter10).at<cv::Vec3b>(0, 0), cv::Vec3b(255, 110, 11));
    EXPECT_EQ(Alter(photo, Alteration::Darker10).at<cv::Vec3b>(0, 0), cv::Vec3b(216, 90, 9));
}
