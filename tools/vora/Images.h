#pragma once

// Reading and writing photographs. In memory a photo is 8-bit R, G, B (three
// channels) or R, G, B, A (four), continuous, whatever the file held:
// greyscale is expanded, 16-bit samples are reduced, alpha is kept apart from
// the colour so that it passes through untouched.

#include <cstdint>
#include <optional>
#include <string>

#include <opencv2/core.hpp>

namespace vora {
namespace cli {

struct Photo {
    std::string path;
    cv::Mat pixels;  // CV_8UC3 (RGB) or CV_8UC4 (RGBA), continuous
    bool hasAlpha() const { return pixels.channels() == 4; }
};

// Images above this many pixels are refused before decoding unless
// --max-pixels raises the limit: 128 megapixels, about 3.5 GB for suggest.
constexpr uint64_t kDefaultMaxPixels = 128000000;

// Throws Failure("<path>: <what is wrong>"). Prints a notice when 16-bit
// samples are reduced to 8 bits. The size is read from the file's header
// first: an image above maxPixels, a format whose header gives no size, and a
// JPEG file cut short (no end marker) are refused without decoding.
Photo ReadPhoto(const std::string& path, uint64_t maxPixels = kDefaultMaxPixels);

// The value of --max-pixels when given, else kDefaultMaxPixels.
uint64_t MaxPixelsOption(const std::optional<std::string>& value);

// A continuous CV_8UC3 R, G, B image: the pixels themselves when there is no
// alpha, else a copy without it. The compute operations read only this form.
cv::Mat PackedRgb(const Photo& photo);

// Usage error unless the extension names a format we write (.jpg, .jpeg,
// .png, .tif, .tiff, .webp).
void CheckImageExtension(const std::string& path);

// Encodes an RGB or RGBA image in the format named by path's extension, then
// writes it atomically (replacing a file at path only when replace is true).
// JPEG has no alpha: it is dropped with a notice.
// The photo scaled down by area averaging so that its long side is `maxSide`
// (the other side rounded, at least 1), alpha and all; the photo itself when
// it is no larger.
cv::Mat ScaledToLongSide(const cv::Mat& pixels, int maxSide);

void WriteImage(const std::string& path, const cv::Mat& rgbOrRgba, bool replace);

}  // namespace cli
}  // namespace vora
