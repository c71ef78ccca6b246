#pragma once

#include <cstddef>

namespace vora {

// Entry i stands for x = i / 3000. Generated at build time (GenerateColorTables).
constexpr std::size_t kTableSize = 3001;
extern const float gammaTable[kTableSize];         // x^2.2
extern const float inverseGammaTable[kTableSize];  // x^(1/2.2)
extern const float labTable[kTableSize];           // Lab companding of x

// Nearest entry, halves upward, in float arithmetic. No clamping: every caller
// keeps v within [0, 1].
inline std::size_t TableIndex(float v) { return static_cast<std::size_t>(v * 3000.0f + 0.5f); }

}  // namespace vora
