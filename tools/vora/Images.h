#pragma once

// Reading and writing photographs. In memory a photo is 8-bit R, G, B (three
// channels) or R, G, B, A (four), continuous, whatever the file held:
// greyscale is expanded, 16-bit samples are reduced, alpha is kept apart from
// the colour so that it passes through untouched.

#include <string>

#include <opencv2/core.hpp>

namespace vora {
namespace cli {

struct Photo {
    std::string path;
    cv::Mat pixels;  // CV_8UC3 (RGB) or CV_8UC4 (RGBA), continuous
    bool hasAlpha() const { return pixels.channels() == 4; }
};

// Throws Failure("<path>: <what is wrong>"). Prints a notice when 16-bit
// samples are reduced to 8 bits.
Photo ReadPhoto(const std::string& path);

// A continuous CV_8UC3 R, G, B image: the pixels themselves when there is no
// alpha, else a copy without it. The compute operations read only this form.
cv::Mat PackedRgb(const Photo& photo);

// Usage error unless the extension names a format we write (.jpg, .jpeg,
// .png, .tif, .tiff, .webp).
void CheckImageExtension(const std::string& path);

// Encodes an RGB or RGBA image in the format named by path's extension, then
// writes it atomically. JPEG has no alpha: it is dropped with a notice.
void WriteImage(const std::string& path, const cv::Mat& rgbOrRgba);

}  // namespace cli
}  // namespace vora
