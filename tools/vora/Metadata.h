#pragma once

// Metadata of photos, read and written with exiv2: what the input carries
// (EXIF, XMP, IPTC and its colour profile) is read with its pixels and written
// into the image outputs made from it.

#include <memory>
#include <string>
#include <vector>

#include <opencv2/core.hpp>

namespace vora {
namespace cli {

// The metadata of one input file; opaque outside Metadata.cpp.
struct PhotoMetadata;

// Reads the metadata of an encoded image. Never throws: metadata that exiv2
// cannot read is reported by a notice naming `path` and left out (`profile`
// stays empty then). `profile` receives the embedded ICC profile, if any.
std::shared_ptr<const PhotoMetadata> ReadPhotoMetadata(const std::vector<uchar>& encoded, const std::string& path,
                                                       std::string* profile);

// What an output carries besides its pixels.
struct OutputMetadata {
    // Copied from here (EXIF, XMP, IPTC), unless null or stripped.
    const PhotoMetadata* source = nullptr;
    bool strip = false;
    // The ICC profile to embed (always: an output says what its pixels are).
    std::string profile;
    // The output's size, for the EXIF tags that state it.
    int width = 0;
    int height = 0;
    bool alpha = false;
};

// Returns the encoded image with the metadata written into it. Copied EXIF has
// its orientation reset to upright (the pixels were turned when read), its
// thumbnail dropped (it shows the original colours), the tags of the source
// file's own layout (TIFF strips, sizes, sample format) left out, and Software
// set to "vora <version>". Throws Failure naming `path` if exiv2 cannot write
// into the encoded image.
std::vector<uchar> WithMetadata(const std::vector<uchar>& encoded, const OutputMetadata& metadata,
                                const std::string& path);

}  // namespace cli
}  // namespace vora
