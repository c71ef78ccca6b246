#pragma once

// Photographs as the model builder and the retrieval measurement see them:
// listed in a fixed order, read into 8-bit BGR, and altered the way a photo
// is altered on its way to a user (cropped, shrunk, recompressed, brightened).

#include <string>
#include <vector>

#include <opencv2/core.hpp>

namespace vora {
namespace modelkit {

// The image files (JPEG, PNG, TIFF, WebP, by extension, any case) directly in
// dir, sorted by file name (byte order), as full paths. Throws
// std::runtime_error when dir cannot be read.
std::vector<std::string> ListPhotos(const std::string& dir);

// Reads a photo as 8-bit BGR: greyscale expanded to three equal channels,
// alpha dropped, 16-bit samples reduced to 8 bits (divided by 257, rounded).
// The orientation recorded in the file is applied, as a viewer shows it.
// Throws std::runtime_error naming the file when it cannot be read.
cv::Mat ReadPhotoBgr(const std::string& path);

// The rule that picks photographs out of a data package's images: 8-bit,
// opaque (three channels, or four with every alpha sample at 255), and at
// least minShortSide pixels on the shorter side. Icons, drawings and cut-outs
// carry transparency or are small; photographs are neither. image is the
// file as decoded with cv::IMREAD_UNCHANGED.
bool LooksLikePhotograph(const cv::Mat& image, int minShortSide = 400);

enum class Alteration { Crop80, HalfSize, Jpeg60, Brighter10, Darker10 };

// Every alteration, in a fixed order.
const std::vector<Alteration>& AllAlterations();

const char* AlterationName(Alteration alteration);

// Crop80: the central 80 % of each side; HalfSize: half each side (area
// interpolation); Jpeg60: a JPEG round trip at quality 60; Brighter10 and
// Darker10: every sample times 1.1 or 0.9, rounded and saturated.
cv::Mat Alter(const cv::Mat& bgr8, Alteration alteration);

}  // namespace modelkit
}  // namespace vora
