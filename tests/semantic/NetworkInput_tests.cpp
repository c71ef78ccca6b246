#include <gtest/gtest.h>

#include <opencv2/core.hpp>
#include <opencv2/imgproc.hpp>

#include "semantic/NetworkInput.h"

namespace vora {
namespace {

TEST(NetworkInput, AspectCropKeepsOrCutsTheLongSide) {
    // Below the 1.5 ratio the image is used whole.
    EXPECT_EQ(AspectCropRegion(100, 149), cv::Rect(0, 0, 149, 100));
    // 100 x 151: keep 149, excess 2, offset 1.
    EXPECT_EQ(AspectCropRegion(100, 151), cv::Rect(1, 0, 149, 100));
    // Portrait cuts rows instead.
    EXPECT_EQ(AspectCropRegion(151, 100), cv::Rect(0, 1, 100, 149));
    // Exactly 1.5 keeps one pixel less than 1.5 times the short side; the odd
    // excess is made even, so the region starts at 0.
    EXPECT_EQ(AspectCropRegion(1000, 1500), cv::Rect(0, 0, 1499, 1000));
    // A sliver keeps at least one pixel.
    EXPECT_EQ(AspectCropRegion(1, 10), cv::Rect(4, 0, 1, 1));
    EXPECT_EQ(AspectCropRegion(64, 64), cv::Rect(0, 0, 64, 64));
}

TEST(NetworkInput, CanvasHasAsymmetricBlackBorder) {
    cv::Mat image(90, 120, CV_8UC3, cv::Scalar(200, 100, 50));
    cv::Mat input;
    ASSERT_TRUE(PrepareNetworkImage(image, input, kNetworkImageSize, kNetworkInputSize));
    ASSERT_EQ(input.size(), cv::Size(256, 256));
    ASSERT_EQ(input.type(), CV_8UC3);
    const cv::Rect area(14, 14, 227, 227);
    // Every pixel inside the area carries the image colour, everything else is black.
    EXPECT_EQ(cv::countNonZero(input(area).reshape(1) != 0), 227 * 227 * 3);
    cv::Mat outside = input.clone();
    outside(area).setTo(cv::Scalar::all(0));
    EXPECT_EQ(cv::countNonZero(outside.reshape(1)), 0);
    EXPECT_EQ(input.at<cv::Vec3b>(14, 14), cv::Vec3b(200, 100, 50));
    EXPECT_EQ(input.at<cv::Vec3b>(240, 240), cv::Vec3b(200, 100, 50));
    EXPECT_EQ(input.at<cv::Vec3b>(241, 241), cv::Vec3b(0, 0, 0));
}

TEST(NetworkInput, ResizesTheCroppedRegionWithAreaInterpolation) {
    cv::Mat image(100, 151, CV_8UC3);
    cv::randu(image, 0, 256);
    cv::Mat input;
    ASSERT_TRUE(PrepareNetworkImage(image, input, kNetworkImageSize, kNetworkInputSize));
    cv::Mat expected;
    cv::resize(image(cv::Rect(1, 0, 149, 100)), expected, cv::Size(227, 227), 0, 0, cv::INTER_AREA);
    EXPECT_EQ(cv::norm(input(cv::Rect(14, 14, 227, 227)), expected, cv::NORM_INF), 0.0);

    // Without a border the region is resized straight to the crop size.
    cv::Mat direct;
    ASSERT_TRUE(PrepareNetworkImage(image, direct, 227, 227));
    EXPECT_EQ(cv::norm(direct, expected, cv::NORM_INF), 0.0);
}

TEST(NetworkInput, EmptyImageIsReportedOnStandardError) {
    cv::Mat input(3, 3, CV_8UC3, cv::Scalar::all(7));
    testing::internal::CaptureStderr();
    EXPECT_FALSE(PrepareNetworkImage(cv::Mat(), input, kNetworkImageSize, kNetworkInputSize));
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "Could not open or find the image\n");
    EXPECT_EQ(input.rows, 3);  // the output is left as it was
}

}  // namespace
}  // namespace vora
