#include "vora/Images.h"

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include "vora/Cli.h"
#include "vora/ImageHeader.h"
#include "vora/OutputFiles.h"

namespace vora {
namespace cli {
namespace {

std::string LowerExtension(const std::string& path) {
    std::string ext = std::filesystem::path(path).extension().string();
    std::transform(ext.begin(), ext.end(), ext.begin(), [](unsigned char c) { return std::tolower(c); });
    return ext;
}

bool IsJpeg(const std::vector<uchar>& bytes) {
    return bytes.size() >= 3 && bytes[0] == 0xFF && bytes[1] == 0xD8 && bytes[2] == 0xFF;
}

}  // namespace

uint64_t MaxPixelsOption(const std::optional<std::string>& value) {
    if (!value) return kDefaultMaxPixels;
    return static_cast<uint64_t>(ParseInteger(*value, "--max-pixels", 1, 1LL << 40));
}

Photo ReadPhotoRgb(const std::string& path, uint64_t maxPixels) {
    std::error_code ec;
    if (!std::filesystem::exists(path, ec)) throw Failure(path, "no such file");
    if (std::filesystem::is_directory(path, ec)) throw Failure(path, "is a directory, not an image");
    std::ifstream in(path, std::ios::binary);
    if (!in) throw Failure(path, "cannot open file");
    std::vector<uchar> bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    if (in.bad()) throw Failure(path, "cannot read file");
    if (bytes.empty()) throw Failure(path, "cannot read image (the file is empty)");

    // The decoder allocates whatever the header says: a few hundred kilobytes
    // of PNG can ask for gigabytes. The size is checked before it runs.
    const std::optional<ImageSize> size = ReadImageSize(bytes);
    if (!size) throw Failure(path, "cannot read image (not a JPEG, PNG, TIFF or WebP file, or damaged)");
    if (size->width * size->height > maxPixels)
        throw Failure(path, std::to_string(size->width) + " x " + std::to_string(size->height) + " is more than " +
                                std::to_string(maxPixels) + " pixels; refusing to decode it (--max-pixels raises the limit)");
    // A JPEG cut short decodes without an error, its missing rows streaked.
    if (IsJpeg(bytes) && !JpegEndsWithEndMarker(bytes))
        throw Failure(path, "cannot read image (the JPEG file is cut short: it has no end-of-image marker)");

    // JPEG carries no alpha, so it is decoded the ordinary way, which also
    // turns the picture upright as its EXIF orientation says. Other formats
    // are decoded unchanged to keep their alpha channel and sample depth.
    const int flags = IsJpeg(bytes) ? (cv::IMREAD_ANYDEPTH | cv::IMREAD_ANYCOLOR) : cv::IMREAD_UNCHANGED;
    cv::Mat decoded;
    try {
        // The decoders' libraries print their own warnings (libpng: "known
        // incorrect sRGB profile"); failures are reported in our words.
        MutedStandardError muted;
        decoded = cv::imdecode(bytes, flags);
    } catch (const cv::Exception&) {
        decoded.release();
    }
    if (decoded.empty())
        throw Failure(path, "cannot read image (not a JPEG, PNG, TIFF or WebP file, or damaged)");
    if (decoded.dims != 2 || decoded.rows < 1 || decoded.cols < 1) throw Failure(path, "cannot read image (no pixels)");

    if (decoded.depth() == CV_16U) {
        PrintNotice(path + ": 16-bit samples reduced to 8 bits");
        cv::Mat reduced;
        decoded.convertTo(reduced, CV_8U, 1.0 / 257.0);  // 65535 -> 255, rounded
        decoded = reduced;
    } else if (decoded.depth() != CV_8U) {
        throw Failure(path, "cannot read image (samples are neither 8- nor 16-bit integers)");
    }

    Photo photo;
    photo.path = path;
    switch (decoded.channels()) {
    case 1:
        cv::cvtColor(decoded, photo.pixels, cv::COLOR_GRAY2RGB);
        break;
    case 2: {
        // Grey and alpha.
        cv::Mat planes[2];
        cv::split(decoded, planes);
        cv::Mat merged[4] = {planes[0], planes[0], planes[0], planes[1]};
        cv::merge(merged, 4, photo.pixels);
        break;
    }
    case 3:
        cv::cvtColor(decoded, photo.pixels, cv::COLOR_BGR2RGB);
        break;
    case 4:
        cv::cvtColor(decoded, photo.pixels, cv::COLOR_BGRA2RGBA);
        break;
    default:
        throw Failure(path, "cannot read image (" + std::to_string(decoded.channels()) + " channels)");
    }
    if (!photo.pixels.isContinuous()) photo.pixels = photo.pixels.clone();

    photo.storedGrey = decoded.channels() <= 2;
    photo.metadata = ReadPhotoMetadata(bytes, path, &photo.profile.bytes);
    if (!photo.profile.bytes.empty()) {
        std::string why;
        photo.profileKind = ExamineProfile(photo.profile, photo.storedGrey, &why);
        if (photo.profileKind == ProfileKind::Unusable) {
            PrintNotice(path + ": " + why + "; its pixels are taken as sRGB");
        } else if (photo.profileKind == ProfileKind::Convertible) {
            ConvertToSrgb(photo.pixels, photo.profile, photo.storedGrey);
            PrintNotice(path + ": converted from " + photo.profile.name + " to sRGB");
        }
    }
    return photo;
}

cv::Mat PackedRgb(const Photo& photo) {
    if (!photo.hasAlpha()) return photo.pixels;
    cv::Mat rgb;
    cv::cvtColor(photo.pixels, rgb, cv::COLOR_RGBA2RGB);
    return rgb;
}

void CheckImageExtension(const std::string& path) {
    static const char* const kKnown[] = {".jpg", ".jpeg", ".png", ".tif", ".tiff", ".webp"};
    const std::string ext = LowerExtension(path);
    for (const char* known : kKnown)
        if (ext == known) return;
    throw UsageError(path + ": unknown image format '" + ext +
                     "' (the extension chooses it: .jpg, .png, .tif or .webp)");
}

void WriteImage(const std::string& path, const cv::Mat& srgbPixels, bool replace, const ImageTags& tags) {
    const std::string ext = LowerExtension(path);
    cv::Mat rgbOrRgba = srgbPixels;
    std::string profile = SrgbProfileBytes();
    const Photo* source = tags.source;
    if (tags.keepProfile && source != nullptr && !source->profile.bytes.empty()) {
        // A grey profile cannot describe colour pixels, and an unusable one
        // was never applied: those outputs stay sRGB.
        if (source->profileKind == ProfileKind::Convertible && !source->storedGrey) {
            rgbOrRgba = srgbPixels.clone();
            ConvertFromSrgb(rgbOrRgba, source->profile);
            profile = source->profile.bytes;
        } else if (source->profileKind == ProfileKind::Srgb && !source->storedGrey) {
            profile = source->profile.bytes;
        }
    }
    cv::Mat bgr;
    std::vector<int> params;
    if (ext == ".jpg" || ext == ".jpeg") {
        if (rgbOrRgba.channels() == 4) PrintNotice(path + ": JPEG has no alpha channel; it is dropped");
        cv::cvtColor(rgbOrRgba, bgr, rgbOrRgba.channels() == 4 ? cv::COLOR_RGBA2BGR : cv::COLOR_RGB2BGR);
        params = {cv::IMWRITE_JPEG_QUALITY, 95};
    } else {
        cv::cvtColor(rgbOrRgba, bgr, rgbOrRgba.channels() == 4 ? cv::COLOR_RGBA2BGRA : cv::COLOR_RGB2BGR);
        // WebP at quality above 100 is lossless: a restyled photo should not
        // lose more than the JPEG it may have come from.
        if (ext == ".webp") params = {cv::IMWRITE_WEBP_QUALITY, 101};
    }
    std::vector<uchar> encoded;
    bool ok = false;
    try {
        ok = cv::imencode(ext, bgr, encoded, params);
    } catch (const cv::Exception& e) {
        throw Failure(path, "cannot encode image (" + e.err + ")");
    }
    if (!ok) throw Failure(path, "cannot encode image");
    OutputMetadata metadata;
    metadata.source = source != nullptr ? source->metadata.get() : nullptr;
    metadata.strip = tags.stripMetadata;
    metadata.profile = profile;
    metadata.width = srgbPixels.cols;
    metadata.height = srgbPixels.rows;
    metadata.alpha = bgr.channels() == 4;
    encoded = WithMetadata(encoded, metadata, path);
    WriteFileAtomically(path, std::string(encoded.begin(), encoded.end()), replace);
}

ImageTags ImageTagsFor(const ParsedArgs& parsed, const Photo& source) {
    ImageTags tags;
    tags.source = &source;
    tags.keepProfile = parsed.Flag("--keep-profile");
    tags.stripMetadata = parsed.Flag("--strip-metadata");
    return tags;
}

cv::Mat ScaledToLongSide(const cv::Mat& pixels, int maxSide) {
    const int longSide = std::max(pixels.cols, pixels.rows);
    if (longSide <= maxSide) return pixels;
    const double f = static_cast<double>(maxSide) / longSide;
    const cv::Size size(std::max(1, static_cast<int>(std::lround(pixels.cols * f))),
                        std::max(1, static_cast<int>(std::lround(pixels.rows * f))));
    cv::Mat scaled;
    cv::resize(pixels, scaled, size, 0, 0, cv::INTER_AREA);
    return scaled;
}

}  // namespace cli
}  // namespace vora
