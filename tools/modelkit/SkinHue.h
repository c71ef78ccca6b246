#pragma once

// The colour of a face in a photo and how a proposal turns it: the median
// a* and b* over the face box (CIE Lab from sRGB, OpenCV's float
// conversion), and the angle between hues. Used to check that proposals
// keep skin looking like skin.

#include <string>

#include <opencv2/core.hpp>
#include <vora/vora.h>

namespace vora {
namespace modelkit {

struct SkinColour {
    double a = 0;
    double b = 0;
    double HueDegrees() const;  // atan2(b*, a*) in [0, 360)
};

// "L,R,T,B" with 0 <= L < R <= 1 and 0 <= T < B <= 1: normalised, y downward,
// as `vora faces` prints a box and `--faces` takes it.
bool ParseFaceRect(const std::string& text, CFaceRect& box);

// Median a* and b* (each on its own) of the box's pixels; the box covers at
// least one pixel. Empty images give false.
bool MeasureSkin(const cv::Mat& bgr, const CFaceRect& box, SkinColour& colour);
bool MeasureSkin(const std::string& path, const CFaceRect& box, SkinColour& colour);

// The hue of `to` minus that of `from`, in (-180, 180].
double HueTurn(const SkinColour& from, const SkinColour& to);

}  // namespace modelkit
}  // namespace vora
