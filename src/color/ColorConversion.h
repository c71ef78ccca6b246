#pragma once

// The per-pixel conversions between 8-bit RGB and the working Lab space
// (L*/100, a*, b*). Compute (statistics, face measurement) and apply both call
// these, so the two sides agree to the last rounding step. Every cast marks a
// rounding point that the results depend on; keep them where they are.

#include <algorithm>
#include <cstdint>

#include "color/ColorTables.h"

// Fast math would reorder and fuse the operations whose rounding this file
// pins; every target including it is built with -ffp-contract=off as well.
#ifdef __FAST_MATH__
#error "the colour conversions must not be compiled with fast math"
#endif

namespace vora {

// Bit-exact constants (hex literals, so no decimal reading can round them).
constexpr float kInvWhiteX = 0x1.0d54fap+0f;    // 1/0.9505, bits 0x3F86AA7D
constexpr float kInvWhiteZ = 0x1.d63304p-1f;    // 1/1.0889, bits 0x3F6B1982
constexpr float kWhiteX = 0x1.e6a7f0p-1f;       // 0.9505, bits 0x3F7353F8
constexpr float kWhiteZ = 0x1.16c226p+0f;       // 1.0889, bits 0x3F8B6113
constexpr float kLabEpsilonF = 0x1.a7b962p-3f;  // 6/29, bits 0x3E53DCB1
constexpr float kLabOffset = 0x1.1a7b96p-3f;    // 4/29, bits 0x3E0D3DCB
constexpr float kLabSlopeInv = 0x1.07004ep-3f;  // 108/841, bits 0x3E038027

struct LabPixel {
    float lightness01;  // L*/100
    float a;
    float b;
};

// From XYZ (X and Z not yet divided by the white point) to working Lab; the
// common tail of both forms of the conversion.
inline LabPixel LabFromXyz(float x, float y, float z, std::size_t& lightnessEntry) {
    x = x * kInvWhiteX;
    z = z * kInvWhiteZ;

    const float fx = labTable[TableIndex(x)];
    lightnessEntry = TableIndex(y);
    const float fy = labTable[lightnessEntry];
    const float fz = labTable[TableIndex(z)];

    LabPixel lab;
    lab.lightness01 = static_cast<float>((static_cast<double>(fy) * 116.0 - 16.0) / 100.0);
    lab.a = static_cast<float>(static_cast<double>(fx - fy) * 500.0);
    lab.b = static_cast<float>(static_cast<double>(fy - fz) * 200.0);
    return lab;
}

// lightnessEntry receives the labTable entry the lightness comes from: an
// image's lightness takes at most one value per entry.
inline LabPixel RgbToLab(uint8_t red, uint8_t green, uint8_t blue, std::size_t& lightnessEntry) {
    // Pure 2.2 power law, no linear toe.
    const double r = gammaTable[TableIndex(static_cast<float>(red) / 255.0f)];
    const double g = gammaTable[TableIndex(static_cast<float>(green) / 255.0f)];
    const double b = gammaTable[TableIndex(static_cast<float>(blue) / 255.0f)];

    const float x = static_cast<float>(0.412453 * r + 0.35758 * g + 0.180423 * b);
    const float y = static_cast<float>(0.212671 * r + 0.71516 * g + 0.072169 * b);
    const float z = static_cast<float>(0.019334 * r + 0.119193 * g + 0.950227 * b);
    return LabFromXyz(x, y, z, lightnessEntry);
}

inline LabPixel RgbToLab(uint8_t red, uint8_t green, uint8_t blue) {
    std::size_t lightnessEntry;
    return RgbToLab(red, green, blue, lightnessEntry);
}

inline float LabExpand(float f) {
    return f > kLabEpsilonF ? f * f * f : (f - kLabOffset) * kLabSlopeInv;
}

// Clamp to [0, 1]; NaN becomes 0 (std::max keeps its first argument when the
// comparison fails), so a lookup index is always inside the table.
inline float ClampUnit(float v) {
    v = std::max(0.0f, v);
    return v < 1.0f ? v : 1.0f;
}

// Truncation, not rounding: only exactly 1.0 gives 255.
inline uint8_t EncodeByte(float linear) {
    return static_cast<uint8_t>(static_cast<int>(inverseGammaTable[TableIndex(ClampUnit(linear))] * 255.0f));
}

struct Rgb8 {
    uint8_t red;
    uint8_t green;
    uint8_t blue;
};

inline Rgb8 LabToRgb(float lightness01, float a, float b) {
    const float fy = static_cast<float>((static_cast<double>(lightness01) * 100.0 + 16.0) / 116.0);
    const float fx = static_cast<float>(static_cast<double>(a) / 500.0 + fy);
    const float fz = static_cast<float>(fy - static_cast<double>(b) / 200.0);

    const double x = LabExpand(fx) * kWhiteX;
    const double y = LabExpand(fy);
    const double z = LabExpand(fz) * kWhiteZ;

    const float r = static_cast<float>(3.240479 * x - 1.53715 * y - 0.498535 * z);
    const float g = static_cast<float>(-0.969256 * x + 1.875991 * y + 0.041556 * z);
    const float bl = static_cast<float>(0.055648 * x - 0.204043 * y + 1.057311 * z);
    return Rgb8{EncodeByte(r), EncodeByte(g), EncodeByte(bl)};
}

}  // namespace vora
