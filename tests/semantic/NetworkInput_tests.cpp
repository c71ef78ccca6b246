#include <gtest/gtest.h>

#include <opencv2/core.hpp>
#include <opencv2/imgproc.hpp>

#include "semantic/NetworkInput.h"

namespace vora {
namespace {

TEST(NetworkInput, AspectCropKeepsOrCutsTheLongSide) {
    EXPECT_EQ(AspectCropRegion(100, 149), cv::Rect(0, 0, 149, 100));  // below 1.5: whole
    EXPECT_EQ(AspectCropRegion(151, 100), cv::Rect(0, 1, 100, 149));  // portrait cuts rows
    // Exactly 1.5 keeps one pixel less; the odd excess is made even, so the region starts at 0.
    EXPECT_EQ(AspectCropRegion(1000, 1500), cv::Rect(0, 0, 1499, 1000));
    EXPECT_EQ(AspectCropRegion(1, 10), cv::Rect(4, 0, 1, 1));  // a sliver keeps one pixel
}

// The cropped region (of 100 x 151: keep 149, excess 2, offset 1), area-resized
// to 227 x 227, sits on a black 256 x 256 canvas with a border of 14 above and
// left, 15 below and right.
TEST(NetworkInput, AreaResizedCropOnABlackCanvas) {
    cv::Mat image(100, 151, CV_8UC3), input, canvas(256, 256, CV_8UC3, cv::Scalar::all(0));
    cv::randu(image, cv::Scalar::all(1), cv::Scalar::all(256));  // no black pixel: the border alone is black
    const cv::Mat inside = canvas(cv::Rect(14, 14, 227, 227));
    cv::resize(image(cv::Rect(1, 0, 149, 100)), inside, inside.size(), 0, 0, cv::INTER_AREA);
    ASSERT_TRUE(PrepareNetworkImage(image, input, kNetworkImageSize, kNetworkInputSize));
    EXPECT_EQ(cv::norm(input, canvas, cv::NORM_INF), 0.0);
}

// Compute prepares the input from the caller's R, G, B bytes and reorders only
// the small result; the area resize must treat the channels alike for that to
// give the bytes of preparing a B, G, R copy. Shrinks by fractional and whole
// factors, and an enlargement.
TEST(NetworkInput, ReorderingAfterTheResizeGivesTheSameInput) {
    for (const cv::Size size : {cv::Size(6000, 4000), cv::Size(1135, 1362), cv::Size(454, 454), cv::Size(150, 101)}) {
        cv::Mat bgr(size, CV_8UC3), rgb, fromBgr, fromRgb;
        cv::randu(bgr, cv::Scalar::all(0), cv::Scalar::all(256));
        cv::cvtColor(bgr, rgb, cv::COLOR_BGR2RGB);
        ASSERT_TRUE(PrepareNetworkImage(bgr, fromBgr, kNetworkImageSize, kNetworkInputSize));
        ASSERT_TRUE(PrepareNetworkImage(rgb, fromRgb, kNetworkImageSize, kNetworkInputSize));
        cv::cvtColor(fromRgb, fromRgb, cv::COLOR_RGB2BGR);
        EXPECT_EQ(cv::norm(fromBgr, fromRgb, cv::NORM_INF), 0.0) << size;
    }
}

}  // namespace
}  // namespace vora
