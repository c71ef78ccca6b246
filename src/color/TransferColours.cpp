#include "color/TransferColours.h"

#include <algorithm>
#include <cstring>
#include <stdexcept>

#ifdef VORA_AVX2_KERNEL
#include <immintrin.h>
#endif

namespace vora {
namespace {

// Colours per stage run: the run's three planes stay in the first-level cache.
constexpr std::size_t kRun = 256;

// Working Lab of each colour of a run, into three planes.
void LabStage(const uint32_t* colours, std::size_t count, float* lightness, float* a, float* b) {
    const LabByTables& toLab = LabByTables::Get();
    for (std::size_t i = 0; i < count; ++i) {
        std::size_t lightnessEntry;
        const uint32_t colour = colours[i];
        const LabPixel lab = toLab(static_cast<uint8_t>(colour >> 16), static_cast<uint8_t>(colour >> 8),
                                   static_cast<uint8_t>(colour), lightnessEntry);
        lightness[i] = lab.lightness01;
        a[i] = lab.a;
        b[i] = lab.b;
    }
}

void ScalarColours(const TRANSFER& transfer, const uint32_t* colours, std::size_t count, uint32_t* outputs,
                   const LightnessLift* lift) {
    float lightness[kRun], a[kRun], b[kRun];
    for (std::size_t done = 0; done < count; done += kRun) {
        const std::size_t n = std::min(kRun, count - done);
        LabStage(colours + done, n, lightness, a, b);
        for (std::size_t i = 0; i < n; ++i) {
            lightness[i] = ToneCurveLookup(transfer.toneCurve, NormaliseLightness(lightness[i], transfer.lightnessLow,
                                                                                  transfer.lightnessHigh));
            const ChromaPixel chroma =
                MapChroma(transfer.contentMean, transfer.chromaMatrix, transfer.styleMean, a[i], b[i]);
            a[i] = chroma.a;
            b[i] = chroma.b;
        }
        if (lift != nullptr) (*lift)(done, n, lightness, a, b);
        for (std::size_t i = 0; i < n; ++i) {
            const Rgb8 rgb = LabToRgb(lightness[i], a[i], b[i]);
            outputs[done + i] = PackRgb(rgb.red, rgb.green, rgb.blue);
        }
    }
}

#ifdef VORA_AVX2_KERNEL

// Eight float lanes as two halves of four doubles: the double steps of the
// scalar chain run on the halves and round back to float where it does.
struct Halves {
    __m256d low, high;
};

#define VORA_AVX2 __attribute__((target("avx2")))

VORA_AVX2 inline Halves Widen(__m256 v) {
    return {_mm256_cvtps_pd(_mm256_castps256_ps128(v)), _mm256_cvtps_pd(_mm256_extractf128_ps(v, 1))};
}
VORA_AVX2 inline __m256 Narrow(Halves v) {
    return _mm256_set_m128(_mm256_cvtpd_ps(v.high), _mm256_cvtpd_ps(v.low));
}
VORA_AVX2 inline Halves Add(Halves x, Halves y) {
    return {_mm256_add_pd(x.low, y.low), _mm256_add_pd(x.high, y.high)};
}
VORA_AVX2 inline Halves Sub(Halves x, Halves y) {
    return {_mm256_sub_pd(x.low, y.low), _mm256_sub_pd(x.high, y.high)};
}
VORA_AVX2 inline Halves Scale(double k, Halves x) {
    const __m256d kk = _mm256_set1_pd(k);
    return {_mm256_mul_pd(kk, x.low), _mm256_mul_pd(kk, x.high)};
}
VORA_AVX2 inline Halves Divide(Halves x, double k) {
    const __m256d kk = _mm256_set1_pd(k);
    return {_mm256_div_pd(x.low, kk), _mm256_div_pd(x.high, kk)};
}
VORA_AVX2 inline Halves Offset(Halves x, double k) {
    const __m256d kk = _mm256_set1_pd(k);
    return {_mm256_add_pd(x.low, kk), _mm256_add_pd(x.high, kk)};
}

// LabExpand: the comparison is false for NaN, as in the scalar form.
VORA_AVX2 inline __m256 Expand(__m256 f) {
    const __m256 cube = _mm256_mul_ps(_mm256_mul_ps(f, f), f);
    const __m256 line = _mm256_mul_ps(_mm256_sub_ps(f, _mm256_set1_ps(kLabOffset)), _mm256_set1_ps(kLabSlopeInv));
    return _mm256_blendv_ps(line, cube, _mm256_cmp_ps(f, _mm256_set1_ps(kLabEpsilonF), _CMP_GT_OQ));
}

// Clamp to [0, 1] as ClampUnit does: maxps returns its second operand for
// NaN and for -0, so both become +0; minps keeps v only when v < 1.
VORA_AVX2 inline __m256 ClampUnit8(__m256 v) {
    return _mm256_min_ps(_mm256_max_ps(v, _mm256_setzero_ps()), _mm256_set1_ps(1.0f));
}

// EncodeByte: TableIndex (v x 3000 + 0.5, truncated), the lookup, x 255, truncated.
VORA_AVX2 inline __m256i Encode(Halves linear) {
    const __m256 v = ClampUnit8(Narrow(linear));
    const __m256i entry =
        _mm256_cvttps_epi32(_mm256_add_ps(_mm256_mul_ps(v, _mm256_set1_ps(3000.0f)), _mm256_set1_ps(0.5f)));
    const __m256 encoded = _mm256_i32gather_ps(inverseGammaTable, entry, 4);
    return _mm256_cvttps_epi32(_mm256_mul_ps(encoded, _mm256_set1_ps(255.0f)));
}

// The tone curve and the chroma map of eight colours, in place.
VORA_AVX2 inline void TransferLanes(const TRANSFER& transfer, float* lightness, float* a, float* b) {
    const float spread = transfer.lightnessHigh - transfer.lightnessLow;
    __m256 t = _mm256_set1_ps(2147483648.0f);  // NormaliseLightness's zero spread
    if (spread != 0.0f)
        t = _mm256_div_ps(_mm256_sub_ps(_mm256_loadu_ps(lightness), _mm256_set1_ps(transfer.lightnessLow)),
                          _mm256_set1_ps(spread));
    // t is in [0, 1], so ToneCurveLookup's clamps of x never apply.
    const __m256 x = _mm256_mul_ps(ClampUnit8(t), _mm256_set1_ps(255.0f));
    const __m256i k = _mm256_cvttps_epi32(x);
    const __m256 f = _mm256_sub_ps(x, _mm256_cvtepi32_ps(k));
    const __m256 below = _mm256_i32gather_ps(transfer.toneCurve, k, 4);
    const __m256 above = _mm256_i32gather_ps(transfer.toneCurve, _mm256_add_epi32(k, _mm256_set1_epi32(1)), 4);
    _mm256_storeu_ps(lightness, _mm256_add_ps(_mm256_mul_ps(_mm256_sub_ps(_mm256_set1_ps(1.0f), f), below),
                                              _mm256_mul_ps(f, above)));

    const __m256 d0 = _mm256_sub_ps(_mm256_loadu_ps(a), _mm256_set1_ps(transfer.contentMean[0]));
    const __m256 d1 = _mm256_sub_ps(_mm256_loadu_ps(b), _mm256_set1_ps(transfer.contentMean[1]));
    const float* m = transfer.chromaMatrix;
    _mm256_storeu_ps(a, _mm256_add_ps(_mm256_add_ps(_mm256_mul_ps(_mm256_set1_ps(m[0]), d0),
                                                    _mm256_mul_ps(_mm256_set1_ps(m[1]), d1)),
                                      _mm256_set1_ps(transfer.styleMean[0])));
    _mm256_storeu_ps(b, _mm256_add_ps(_mm256_add_ps(_mm256_mul_ps(_mm256_set1_ps(m[2]), d0),
                                                    _mm256_mul_ps(_mm256_set1_ps(m[3]), d1)),
                                      _mm256_set1_ps(transfer.styleMean[1])));
}

// LabToRgb of eight colours, packed.
VORA_AVX2 inline __m256i RgbLanes(const float* lightness, const float* a, const float* b) {
    const __m256 fy = Narrow(Divide(Offset(Scale(100.0, Widen(_mm256_loadu_ps(lightness))), 16.0), 116.0));
    const Halves fyWide = Widen(fy);
    const __m256 fx = Narrow(Add(Divide(Widen(_mm256_loadu_ps(a)), 500.0), fyWide));
    const __m256 fz = Narrow(Sub(fyWide, Divide(Widen(_mm256_loadu_ps(b)), 200.0)));
    const Halves x = Widen(_mm256_mul_ps(Expand(fx), _mm256_set1_ps(kWhiteX)));
    const Halves y = Widen(Expand(fy));
    const Halves z = Widen(_mm256_mul_ps(Expand(fz), _mm256_set1_ps(kWhiteZ)));
    const __m256i red = Encode(Sub(Sub(Scale(3.240479, x), Scale(1.53715, y)), Scale(0.498535, z)));
    const __m256i green = Encode(Add(Add(Scale(-0.969256, x), Scale(1.875991, y)), Scale(0.041556, z)));
    const __m256i blue = Encode(Add(Sub(Scale(0.055648, x), Scale(0.204043, y)), Scale(1.057311, z)));
    return _mm256_or_si256(_mm256_or_si256(_mm256_slli_epi32(red, 16), _mm256_slli_epi32(green, 8)), blue);
}

// The Lab stage stays scalar (its lookups are faster as loads than as
// gathers); a run is padded to whole lanes with black, whose outputs are
// dropped.
VORA_AVX2 void Avx2Colours(const TRANSFER& transfer, const uint32_t* colours, std::size_t count,
                           uint32_t* outputs, const LightnessLift* lift) {
    alignas(32) float lightness[kRun], a[kRun], b[kRun];
    alignas(32) uint32_t packed[kRun];
    for (std::size_t done = 0; done < count; done += kRun) {
        const std::size_t n = std::min(kRun, count - done);
        const std::size_t lanes = (n + 7) & ~std::size_t{7};
        LabStage(colours + done, n, lightness, a, b);
        std::fill(lightness + n, lightness + lanes, 0.0f);
        std::fill(a + n, a + lanes, 0.0f);
        std::fill(b + n, b + lanes, 0.0f);
        for (std::size_t i = 0; i < lanes; i += 8) TransferLanes(transfer, lightness + i, a + i, b + i);
        if (lift != nullptr) (*lift)(done, n, lightness, a, b);
        for (std::size_t i = 0; i < lanes; i += 8)
            _mm256_store_si256(reinterpret_cast<__m256i*>(packed + i), RgbLanes(lightness + i, a + i, b + i));
        std::memcpy(outputs + done, packed, n * sizeof(uint32_t));
    }
}

#undef VORA_AVX2

#else

void Avx2Colours(const TRANSFER&, const uint32_t*, std::size_t, uint32_t*, const LightnessLift*) {
    throw std::logic_error("the AVX2 colour kernel is not in this build");
}

#endif

}  // namespace

void TransferColours(VectorKernel kernel, const TRANSFER& transfer, const uint32_t* colours, std::size_t count,
                     uint32_t* outputs, const LightnessLift* lift) {
    if (kernel == VectorKernel::Avx2)
        Avx2Colours(transfer, colours, count, outputs, lift);
    else
        ScalarColours(transfer, colours, count, outputs, lift);
}

}  // namespace vora
