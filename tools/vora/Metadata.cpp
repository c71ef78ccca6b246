#include "vora/Metadata.h"

#include <cstring>
#include <stdexcept>
#include <exception>
#include <mutex>

// exiv2 0.27's interface still hands out std::auto_ptr.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
#include <exiv2/exiv2.hpp>
#pragma GCC diagnostic pop

#include <vora/vora.h>
#include <zlib.h>

#include "vora/Cli.h"

#pragma GCC diagnostic ignored "-Wdeprecated-declarations"

namespace vora {
namespace cli {

struct PhotoMetadata {
    Exiv2::ExifData exif;
    Exiv2::XmpData xmp;
    Exiv2::IptcData iptc;
};

namespace {

void LockXmpToolkit(void* mutex, bool lock) {
    if (lock)
        static_cast<std::mutex*>(mutex)->lock();
    else
        static_cast<std::mutex*>(mutex)->unlock();
}

// exiv2's global state: its XMP toolkit is set up once, behind a lock, and
// its warnings are muted (failures are reported in our words).
void InitialiseOnce() {
    static std::mutex xmpToolkit;  // not thread-safe on its own
    static const bool done = [] {
        Exiv2::LogMsg::setLevel(Exiv2::LogMsg::mute);
        return Exiv2::XmpParser::initialize(LockXmpToolkit, &xmpToolkit);
    }();
    (void)done;
}

// Tags that describe how the source file itself was laid out; written into
// another file they would describe data that is not there.
bool IsLayoutTag(const Exiv2::Exifdatum& datum) {
    static const char* const kLayout[] = {
        "NewSubfileType", "SubfileType", "ImageWidth", "ImageLength", "BitsPerSample", "Compression",
        "PhotometricInterpretation", "FillOrder", "StripOffsets", "SamplesPerPixel", "RowsPerStrip",
        "StripByteCounts", "PlanarConfiguration", "Predictor", "TileWidth", "TileLength", "TileOffsets",
        "TileByteCounts", "ExtraSamples", "SampleFormat", "JPEGTables", "InterColorProfile", "SubIFDs",
        "JPEGInterchangeFormat", "JPEGInterchangeFormatLength", "YCbCrSubSampling"};
    const std::string group = datum.groupName();
    if (group.rfind("SubImage", 0) == 0 || group == "Thumbnail") return true;
    if (group != "Image") return false;
    for (const char* name : kLayout)
        if (datum.tagName() == name) return true;
    return false;
}

bool IsPng(const std::vector<uchar>& b) { return b.size() >= 8 && std::memcmp(b.data(), "\x89PNG\r\n\x1a\n", 8) == 0; }
bool IsWebp(const std::vector<uchar>& b) {
    return b.size() >= 12 && std::memcmp(b.data(), "RIFF", 4) == 0 && std::memcmp(b.data() + 8, "WEBP", 4) == 0;
}

void PutBigEndian32(std::vector<uchar>& out, uint32_t v) {
    for (int shift = 24; shift >= 0; shift -= 8) out.push_back(static_cast<uchar>(v >> shift));
}
void PutLittleEndian(std::vector<uchar>& out, uint32_t v, int bytes) {
    for (int i = 0; i < bytes; ++i) out.push_back(static_cast<uchar>(v >> (8 * i)));
}

// exiv2 0.27 writes PNG's iCCP chunk without the keyword the format requires
// (libpng then ignores it) and WebP's under the wrong chunk name, so these two
// containers get their profile here: an iCCP chunk right after IHDR.
std::vector<uchar> WithPngProfile(const std::vector<uchar>& png, const std::string& icc) {
    uLongf packedSize = compressBound(static_cast<uLong>(icc.size()));
    std::vector<uchar> packed(packedSize);
    if (compress2(packed.data(), &packedSize, reinterpret_cast<const Bytef*>(icc.data()),
                  static_cast<uLong>(icc.size()), Z_BEST_COMPRESSION) != Z_OK)
        throw std::runtime_error("cannot compress the colour profile");
    std::vector<uchar> chunk;
    const std::string head = std::string("iCCP") + "ICC profile" + '\0' + '\0';  // keyword, zlib method
    PutBigEndian32(chunk, static_cast<uint32_t>(head.size() - 4 + packedSize));
    chunk.insert(chunk.end(), head.begin(), head.end());
    chunk.insert(chunk.end(), packed.begin(), packed.begin() + static_cast<long>(packedSize));
    PutBigEndian32(chunk, static_cast<uint32_t>(crc32(0, chunk.data() + 4, static_cast<uInt>(chunk.size() - 4))));
    // Signature (8) and IHDR (4 + 4 + 13 + 4).
    const size_t afterHeader = 8 + 25;
    if (png.size() < afterHeader || std::memcmp(png.data() + 12, "IHDR", 4) != 0)
        throw std::runtime_error("unexpected PNG layout");
    std::vector<uchar> out(png.begin(), png.end());
    out.insert(out.begin() + afterHeader, chunk.begin(), chunk.end());
    return out;
}

// WebP: an ICCP chunk right after the VP8X header chunk (made when the file
// is in the simple format), whose ICC flag is set.
std::vector<uchar> WithWebpProfile(const std::vector<uchar>& webp, const std::string& icc, int width, int height,
                                   bool alpha) {
    std::vector<uchar> iccp = {'I', 'C', 'C', 'P'};
    PutLittleEndian(iccp, static_cast<uint32_t>(icc.size()), 4);
    iccp.insert(iccp.end(), icc.begin(), icc.end());
    if (icc.size() % 2 != 0) iccp.push_back(0);

    std::vector<uchar> out(webp.begin(), webp.end());
    if (out.size() >= 30 && std::memcmp(out.data() + 12, "VP8X", 4) == 0) {
        out[20] |= 0x20;  // ICC flag
        out.insert(out.begin() + 30, iccp.begin(), iccp.end());
    } else {
        std::vector<uchar> header = {'V', 'P', '8', 'X', 10, 0, 0, 0};
        header.push_back(static_cast<uchar>(0x20 | (alpha ? 0x10 : 0)));
        header.insert(header.end(), 3, 0);
        PutLittleEndian(header, static_cast<uint32_t>(width - 1), 3);
        PutLittleEndian(header, static_cast<uint32_t>(height - 1), 3);
        header.insert(header.end(), iccp.begin(), iccp.end());
        out.insert(out.begin() + 12, header.begin(), header.end());
    }
    const uint32_t riffSize = static_cast<uint32_t>(out.size() - 8);
    for (int i = 0; i < 4; ++i) out[4 + i] = static_cast<uchar>(riffSize >> (8 * i));
    return out;
}

std::vector<uchar> ReadAll(Exiv2::BasicIo& io) {
    std::vector<uchar> bytes(io.size());
    io.seek(0, Exiv2::BasicIo::beg);
    if (!bytes.empty() && io.read(bytes.data(), static_cast<long>(bytes.size())) != static_cast<long>(bytes.size()))
        throw std::runtime_error("short read");
    return bytes;
}

}  // namespace

std::shared_ptr<const PhotoMetadata> ReadPhotoMetadata(const std::vector<uchar>& encoded, const std::string& path,
                                                       std::string* profile) {
    InitialiseOnce();
    profile->clear();
    try {
        Exiv2::Image::AutoPtr image = Exiv2::ImageFactory::open(encoded.data(), static_cast<long>(encoded.size()));
        image->readMetadata();
        auto metadata = std::make_shared<PhotoMetadata>();
        metadata->exif = image->exifData();
        metadata->xmp = image->xmpData();
        metadata->iptc = image->iptcData();
        if (image->iccProfileDefined()) {
            const Exiv2::DataBuf* icc = image->iccProfile();
            profile->assign(reinterpret_cast<const char*>(icc->pData_), static_cast<size_t>(icc->size_));
        } else {
            // TIFF keeps its profile as a tag.
            const auto tag = metadata->exif.findKey(Exiv2::ExifKey("Exif.Image.InterColorProfile"));
            if (tag != metadata->exif.end() && tag->size() > 0) {
                std::vector<Exiv2::byte> data(tag->size());
                tag->copy(data.data(), Exiv2::invalidByteOrder);
                profile->assign(data.begin(), data.end());
            }
        }
        return metadata;
    } catch (const std::exception&) {
        PrintNotice(path + ": its metadata cannot be read; it is not copied to the outputs");
        profile->clear();
        return nullptr;
    }
}

std::vector<uchar> WithMetadata(const std::vector<uchar>& encoded, const OutputMetadata& metadata,
                                const std::string& path) {
    InitialiseOnce();
    try {
        Exiv2::Image::AutoPtr image = Exiv2::ImageFactory::open(encoded.data(), static_cast<long>(encoded.size()));
        image->readMetadata();
        Exiv2::ExifData exif;
        if (metadata.source != nullptr && !metadata.strip) {
            for (const Exiv2::Exifdatum& datum : metadata.source->exif)
                if (!IsLayoutTag(datum)) exif.add(datum);
            // Pixels are stored upright, in the output's own size.
            const auto orientation = exif.findKey(Exiv2::ExifKey("Exif.Image.Orientation"));
            if (orientation != exif.end()) exif["Exif.Image.Orientation"] = static_cast<uint16_t>(1);
            if (exif.findKey(Exiv2::ExifKey("Exif.Photo.PixelXDimension")) != exif.end())
                exif["Exif.Photo.PixelXDimension"] = static_cast<uint32_t>(metadata.width);
            if (exif.findKey(Exiv2::ExifKey("Exif.Photo.PixelYDimension")) != exif.end())
                exif["Exif.Photo.PixelYDimension"] = static_cast<uint32_t>(metadata.height);

            Exiv2::XmpData xmp = metadata.source->xmp;
            if (xmp.findKey(Exiv2::XmpKey("Xmp.tiff.Orientation")) != xmp.end()) xmp["Xmp.tiff.Orientation"] = "1";
            image->setXmpData(xmp);
            image->setIptcData(metadata.source->iptc);
        }
        if (!metadata.strip) exif["Exif.Image.Software"] = "vora " VORA_VERSION_STRING;
        image->setExifData(exif);
        const bool ownProfile = IsPng(encoded) || IsWebp(encoded);
        if (!metadata.profile.empty() && !ownProfile) {
            Exiv2::DataBuf icc(reinterpret_cast<const Exiv2::byte*>(metadata.profile.data()),
                               static_cast<long>(metadata.profile.size()));
            image->setIccProfile(icc, true);
        }
        image->writeMetadata();
        std::vector<uchar> written = ReadAll(image->io());
        if (metadata.profile.empty() || !ownProfile) return written;
        if (IsPng(written)) return WithPngProfile(written, metadata.profile);
        return WithWebpProfile(written, metadata.profile, metadata.width, metadata.height, metadata.alpha);
    } catch (const std::exception& e) {
        throw Failure(path, std::string("cannot write its metadata (") + e.what() + ")");
    }
}

}  // namespace cli
}  // namespace vora
