#pragma once

// The size of an encoded image, read from its header without decoding it,
// so that the tools can refuse an image too large for memory before the
// decoder allocates it.

#include <cstdint>
#include <optional>
#include <vector>

namespace vora {
namespace cli {

struct ImageSize {
    uint64_t width = 0;
    uint64_t height = 0;
};

// JPEG (the first frame header), PNG (IHDR), TIFF (the first directory),
// WebP (lossy, lossless and extended), BMP and binary or ASCII PNM. Nothing
// for other formats or a header cut short.
std::optional<ImageSize> ReadImageSize(const std::vector<uint8_t>& bytes);

// Whether a JPEG stream ends with its end-of-image marker (trailing zero
// bytes, which some writers add, are allowed). A file cut short decodes
// without an error, its missing rows filled in.
bool JpegEndsWithEndMarker(const std::vector<uint8_t>& bytes);

}  // namespace cli
}  // namespace vora
