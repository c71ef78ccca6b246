#pragma once

#include <opencv2/core.hpp>

#include <vora/vora.h>

namespace vora {

// Imports a whole, tightly packed RGB image as a new B, G, R matrix
// (CV_8UC3). Strides are deliberately not consulted: rows must be exactly
// width x 3 bytes. A null pixel pointer with a non-zero size throws OpenCV's
// exception.
cv::Mat ToWorkingOrder(const IImage* image);

}  // namespace vora
