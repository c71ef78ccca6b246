#include "modelkit/SkinHue.h"

#include <gtest/gtest.h>

using namespace vora::modelkit;

// sRGB red is L* 53.24, a* 80.09, b* 67.20 (D65): hue 40.0 degrees.
TEST(SkinHue, MedianOfTheBoxIgnoresAMinorityAndTheOutside) {
    cv::Mat photo(100, 200, CV_8UC3, cv::Scalar(255, 0, 0));  // blue outside the box
    const vora::CFaceRect box(0.25, 0.75, 0.5, 1.0);  // columns 50..149, rows 50..99
    photo(cv::Rect(50, 50, 100, 50)).setTo(cv::Scalar(0, 0, 255));
    photo(cv::Rect(50, 50, 100, 10)).setTo(cv::Scalar(0, 255, 0));  // a fifth of the box: hair
    SkinColour red;
    ASSERT_TRUE(MeasureSkin(photo, box, red));
    EXPECT_NEAR(red.a, 80.09, 0.1);
    EXPECT_NEAR(red.b, 67.20, 0.1);
    EXPECT_NEAR(red.HueDegrees(), 40.0, 0.1);
    EXPECT_FALSE(MeasureSkin(cv::Mat(), box, red));
}

TEST(SkinHue, TurnsWrapAround) {
    const SkinColour at350{std::cos(350 * CV_PI / 180), std::sin(350 * CV_PI / 180)};
    const SkinColour at10{std::cos(10 * CV_PI / 180), std::sin(10 * CV_PI / 180)};
    EXPECT_NEAR(HueTurn(at350, at10), 20.0, 1e-9);
    EXPECT_NEAR(HueTurn(at10, at350), -20.0, 1e-9);
}
