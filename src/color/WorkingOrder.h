#pragma once

#include <opencv2/core.hpp>

#include <vora/vora.h>

namespace vora {

// Imports a whole, tightly packed RGB image as a new B, G, R matrix
// (CV_8UC3). Strides are deliberately not consulted: rows must be exactly
// width x 3 bytes. A null pixel pointer with a non-zero size throws OpenCV's
// exception.
cv::Mat ToWorkingOrder(const IImage* image);

// The same pixels as they stand (R, G, B), without a copy: a header over the
// image's own bytes, which the caller must keep alive and not modify meanwhile.
cv::Mat RgbView(const IImage* image);

// Byte order of 8-bit colour pixels handed to the colour statistics.
enum class ChannelOrder { Rgb, Bgr };

}  // namespace vora
