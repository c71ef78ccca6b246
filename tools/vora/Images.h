#pragma once

// Reading and writing photographs. In memory a photo is 8-bit R, G, B (three
// channels) or R, G, B, A (four), continuous, whatever the file held:
// greyscale is expanded, 16-bit samples are reduced, alpha is kept apart from
// the colour so that it passes through untouched.

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include <opencv2/core.hpp>

#include "vora/ColourProfiles.h"
#include "vora/Metadata.h"

namespace vora {
namespace cli {

struct Photo {
    std::string path;
    cv::Mat pixels;  // CV_8UC3 (RGB) or CV_8UC4 (RGBA), continuous, in sRGB
    bool hasAlpha() const { return pixels.channels() == 4; }

    // The profile the file carried (bytes empty when untagged) and what was
    // done with it: Convertible ones were converted into sRGB on reading.
    ColourProfile profile;
    ProfileKind profileKind = ProfileKind::Srgb;
    bool storedGrey = false;
    // EXIF, XMP and IPTC of the file; null when unreadable.
    std::shared_ptr<const PhotoMetadata> metadata;
};

// Images above this many pixels are refused before decoding unless
// --max-pixels raises the limit: 128 megapixels, about 3.5 GB for suggest.
constexpr uint64_t kDefaultMaxPixels = 128000000;

// Throws Failure("<path>: <what is wrong>"). Prints a notice when 16-bit
// samples are reduced to 8 bits, and one when the pixels are converted from an
// embedded colour profile into sRGB (or the profile is unusable, and the
// pixels are taken as sRGB). The size is read from the file's header
// first: an image above maxPixels, a format whose header gives no size, and a
// JPEG file cut short (no end marker) are refused without decoding.
Photo ReadPhotoRgb(const std::string& path, uint64_t maxPixels = kDefaultMaxPixels);

// The value of --max-pixels when given, else kDefaultMaxPixels.
uint64_t MaxPixelsOption(const std::optional<std::string>& value);

// A continuous CV_8UC3 R, G, B image: the pixels themselves when there is no
// alpha, else a copy without it. The compute operations read only this form.
cv::Mat PackedRgb(const Photo& photo);

// Usage error unless the extension names a format we write (.jpg, .jpeg,
// .png, .tif, .tiff, .webp).
void CheckImageExtension(const std::string& path);

// The photo scaled down by area averaging so that its long side is `maxSide`
// (the other side rounded, at least 1), alpha and all; the photo itself when
// it is no larger.
cv::Mat ScaledToLongSide(const cv::Mat& pixels, int maxSide);

// What an output image carries besides its pixels.
struct ImageTags {
    // The photo it was made from: its metadata is copied (see WithMetadata).
    const Photo* source = nullptr;
    // Write the pixels in the source's own profile (converted back from
    // sRGB), tagged with it; otherwise they are written as sRGB, tagged so.
    bool keepProfile = false;
    // Copy no EXIF, XMP or IPTC (the colour profile is still embedded).
    bool stripMetadata = false;
};

// Encodes an sRGB RGB or RGBA image in the format named by path's extension,
// with its colour profile and metadata, then writes it atomically (replacing
// a file at path only when replace is true). JPEG has no alpha: it is dropped
// with a notice.
void WriteImage(const std::string& path, const cv::Mat& rgbOrRgba, bool replace, const ImageTags& tags = {});

class ParsedArgs;
// The tags of an output made from `source`, by the flags --keep-profile and
// --strip-metadata (which the command must accept).
ImageTags ImageTagsFor(const ParsedArgs& parsed, const Photo& source);

}  // namespace cli
}  // namespace vora
