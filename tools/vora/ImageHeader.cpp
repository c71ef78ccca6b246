#include "vora/ImageHeader.h"

#include <cctype>
#include <cstring>

namespace vora {
namespace cli {
namespace {

uint32_t Big16(const uint8_t* p) { return static_cast<uint32_t>(p[0]) << 8 | p[1]; }
uint32_t Big32(const uint8_t* p) { return Big16(p) << 16 | Big16(p + 2); }
uint32_t Little16(const uint8_t* p) { return static_cast<uint32_t>(p[1]) << 8 | p[0]; }
uint32_t Little24(const uint8_t* p) { return static_cast<uint32_t>(p[2]) << 16 | Little16(p); }
uint32_t Little32(const uint8_t* p) { return static_cast<uint32_t>(p[3]) << 24 | Little24(p); }

std::optional<ImageSize> JpegSize(const std::vector<uint8_t>& b) {
    size_t at = 2;
    while (at + 4 <= b.size()) {
        if (b[at] != 0xFF) return std::nullopt;
        const uint8_t marker = b[at + 1];
        if (marker == 0xFF) {  // fill byte
            ++at;
            continue;
        }
        if (marker == 0x01 || (marker >= 0xD0 && marker <= 0xD7)) {  // no length
            at += 2;
            continue;
        }
        const size_t length = Big16(&b[at + 2]);
        const bool frame = marker >= 0xC0 && marker <= 0xCF && marker != 0xC4 && marker != 0xC8 && marker != 0xCC;
        if (frame) {
            if (at + 9 > b.size()) return std::nullopt;
            return ImageSize{Big16(&b[at + 7]), Big16(&b[at + 5])};
        }
        if (length < 2) return std::nullopt;
        at += 2 + length;
    }
    return std::nullopt;
}

std::optional<ImageSize> TiffSize(const std::vector<uint8_t>& b) {
    const bool little = b[0] == 'I';
    const auto u16 = [&](size_t at) { return little ? Little16(&b[at]) : Big16(&b[at]); };
    const auto u32 = [&](size_t at) { return little ? Little32(&b[at]) : Big32(&b[at]); };
    const size_t directory = u32(4);
    if (directory + 2 > b.size()) return std::nullopt;
    const size_t entries = u16(directory);
    ImageSize size;
    for (size_t i = 0; i < entries; ++i) {
        const size_t entry = directory + 2 + 12 * i;
        if (entry + 12 > b.size()) return std::nullopt;
        const uint32_t tag = u16(entry), type = u16(entry + 2);
        const uint64_t value = type == 3 ? u16(entry + 8) : type == 4 ? u32(entry + 8) : 0;
        if (tag == 256) size.width = value;
        if (tag == 257) size.height = value;
    }
    if (size.width == 0 || size.height == 0) return std::nullopt;
    return size;
}

std::optional<ImageSize> WebpSize(const std::vector<uint8_t>& b) {
    if (b.size() < 30) return std::nullopt;
    const uint8_t* chunk = &b[12];
    if (std::memcmp(chunk, "VP8 ", 4) == 0) return ImageSize{Little16(&b[26]) & 0x3FFF, Little16(&b[28]) & 0x3FFF};
    if (std::memcmp(chunk, "VP8L", 4) == 0) {
        const uint32_t bits = Little32(&b[21]);
        return ImageSize{(bits & 0x3FFF) + 1, ((bits >> 14) & 0x3FFF) + 1};
    }
    if (std::memcmp(chunk, "VP8X", 4) == 0) return ImageSize{Little24(&b[24]) + uint64_t{1}, Little24(&b[27]) + uint64_t{1}};
    return std::nullopt;
}

// P1 to P6: width and height are the first two numbers after the magic,
// separated by white space and comments.
std::optional<ImageSize> PnmSize(const std::vector<uint8_t>& b) {
    uint64_t numbers[2] = {0, 0};
    size_t at = 2;
    for (uint64_t& number : numbers) {
        for (;;) {
            while (at < b.size() && std::isspace(b[at])) ++at;
            if (at < b.size() && b[at] == '#') {
                while (at < b.size() && b[at] != '\n') ++at;
                continue;
            }
            break;
        }
        if (at >= b.size() || !std::isdigit(b[at])) return std::nullopt;
        while (at < b.size() && std::isdigit(b[at]) && number < (uint64_t{1} << 32)) number = number * 10 + (b[at++] - '0');
    }
    return ImageSize{numbers[0], numbers[1]};
}

}  // namespace

std::optional<ImageSize> ReadImageSize(const std::vector<uint8_t>& b) {
    if (b.size() >= 4 && b[0] == 0xFF && b[1] == 0xD8) return JpegSize(b);
    if (b.size() >= 24 && std::memcmp(b.data(), "\x89PNG\r\n\x1a\n", 8) == 0 && std::memcmp(&b[12], "IHDR", 4) == 0)
        return ImageSize{Big32(&b[16]), Big32(&b[20])};
    if (b.size() >= 8 && (std::memcmp(b.data(), "II*\0", 4) == 0 || std::memcmp(b.data(), "MM\0*", 4) == 0))
        return TiffSize(b);
    if (b.size() >= 16 && std::memcmp(b.data(), "RIFF", 4) == 0 && std::memcmp(&b[8], "WEBP", 4) == 0) return WebpSize(b);
    if (b.size() >= 26 && b[0] == 'B' && b[1] == 'M') {
        const int32_t height = static_cast<int32_t>(Little32(&b[22]));
        return ImageSize{Little32(&b[18]), static_cast<uint64_t>(height < 0 ? -static_cast<int64_t>(height) : height)};
    }
    if (b.size() >= 3 && b[0] == 'P' && b[1] >= '1' && b[1] <= '6') return PnmSize(b);
    return std::nullopt;
}

bool JpegEndsWithEndMarker(const std::vector<uint8_t>& bytes) {
    size_t end = bytes.size();
    while (end > 0 && bytes[end - 1] == 0) --end;
    return end >= 2 && bytes[end - 2] == 0xFF && bytes[end - 1] == 0xD9;
}

}  // namespace cli
}  // namespace vora
