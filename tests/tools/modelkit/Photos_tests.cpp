#include "modelkit/Photos.h"

#include <gtest/gtest.h>

using namespace vora::modelkit;

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
