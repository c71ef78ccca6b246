#pragma once

// The transfer of one pixel's lightness through a tone curve, shared by the
// matrix form used to measure faces and by the apply kernel.

#include <algorithm>
#include <cmath>

namespace vora {

// t in [0, 1] (or NaN, see below). For t = 1 this reads the guard entry 256
// with weight 0, which is why TRANSFER carries 257 entries.
inline float ToneCurveLookup(const float* toneCurve, float t) {
    float x = t * 255.0f;
    // NaN only arises from a zero lightness spread in the matrix form; it
    // takes the same value as apply's zero-spread case, toneCurve[255].
    if (!(x >= 0.0f)) x = std::isnan(x) ? 255.0f : 0.0f;
    if (x > 255.0f) x = 255.0f;
    const int k = static_cast<int>(x);
    const float f = x - static_cast<float>(k);
    return (1.0f - f) * toneCurve[k] + f * toneCurve[k + 1];
}

// Normalised lightness as apply computes it: a zero spread sends everything to
// 1 (t = 2^31 before the clamp); NaN clamps to 0.
inline float NormaliseLightness(float lightness01, float low, float high) {
    const float spread = high - low;
    float t = spread == 0.0f ? 2147483648.0f : (lightness01 - low) / spread;
    t = std::max(0.0f, t);
    return t < 1.0f ? t : 1.0f;
}

// The chroma map of a transfer: (a, b) relative to the content mean, through
// the row-major 2x2 matrix, about the style mean. All in float.
struct ChromaPixel {
    float a;
    float b;
};

inline ChromaPixel MapChroma(const float* contentMean, const float* chromaMatrix, const float* styleMean,
                             float a, float b) {
    const float d0 = a - contentMean[0];
    const float d1 = b - contentMean[1];
    return ChromaPixel{chromaMatrix[0] * d0 + chromaMatrix[1] * d1 + styleMean[0],
                       chromaMatrix[2] * d0 + chromaMatrix[3] * d1 + styleMean[1]};
}

}  // namespace vora
