#include "color/LabByTables.h"

#include <stdexcept>

#ifdef VORA_AVX2_KERNEL
#include <immintrin.h>
#endif

namespace vora {

void LabByTables::ScalarChroma(const uint8_t* pixels, std::size_t count, int redOffset, float* pairs,
                               int64_t* entryCounts) const {
    const int blueOffset = 2 - redOffset;
    for (const uint8_t* const end = pixels + 3 * count; pixels != end; pixels += 3, pairs += 2) {
        std::size_t entry;
        const LabPixel lab = (*this)(pixels[redOffset], pixels[1], pixels[blueOffset], entry);
        ++entryCounts[entry];
        pairs[0] = lab.a;
        pairs[1] = lab.b;
    }
}

#ifdef VORA_AVX2_KERNEL

namespace {

// One pixel's (red + green) + blue rows in double, rounded to float, times
// the white point: (X/Xn, Y, Z/Zn, 0). `rows` holds each channel's 256 rows of
// four doubles.
__attribute__((target("avx2"))) inline __m128 WhiteScaledXyz(const double* rows, const uint8_t* pixel, int redOffset,
                                                            int blueOffset, __m128 white) {
    const __m256d red = _mm256_load_pd(rows + 4 * pixel[redOffset]);
    const __m256d green = _mm256_load_pd(rows + 4 * (256 + pixel[1]));
    const __m256d blue = _mm256_load_pd(rows + 4 * (512 + pixel[blueOffset]));
    return _mm_mul_ps(_mm256_cvtpd_ps(_mm256_add_pd(_mm256_add_pd(red, green), blue)), white);
}

}  // namespace

// Runs of up to kRun pixels in three stage loops, each operation the scalar
// one in the same precision, so the bits are the same:
//  1. per pixel, the double sums of its three rows in one 256-bit addition,
//     rounded to float, white-scaled, and its three table indices, all in
//     one 4-lane vector (X, Y, Z side by side: no transposes);
//  2. the companding lookups and the float differences fx - fy and fy - fz,
//     and the lightness count;
//  3. four pixels at a time, the differences times 500 and 200 in double,
//     rounded to float and interleaved into pairs.
// Short independent loops keep many pixels in flight; the former fused loop
// spent most of its time on shuffles (transposes and lane inserts), which
// all wait on one port. Compiled for AVX2 by attribute alone, so no inline
// function shared with the rest of the library is ever compiled with AVX2
// instructions.
__attribute__((target("avx2"))) void LabByTables::Avx2Chroma(const uint8_t* pixels, std::size_t count,
                                                            int redOffset, float* pairs,
                                                            int64_t* entryCounts) const {
    constexpr std::size_t kRun = 128;  // measured best of 32 to 512: the run's arrays stay in L1
    alignas(16) int32_t entries[4 * kRun];
    alignas(16) float aDiff[kRun];
    alignas(16) float bDiff[kRun];

    const int blueOffset = 2 - redOffset;
    const __m128 white = _mm_set_ps(1.0f, kInvWhiteZ, 1.0f, kInvWhiteX);
    const __m128 scale = _mm_set1_ps(3000.0f);
    const __m128 half = _mm_set1_ps(0.5f);
    const __m256d times500 = _mm256_set1_pd(500.0);
    const __m256d times200 = _mm256_set1_pd(200.0);
    const double* rows = &m_rows[0][0].x;

    while (count > 0) {
        const std::size_t run = count < kRun ? count : kRun;
        for (std::size_t i = 0; i < run; ++i) {
            // TableIndex on each lane: truncation of v x 3000 + 0.5, each rounded to float.
            const __m128 v = WhiteScaledXyz(rows, pixels + 3 * i, redOffset, blueOffset, white);
            _mm_store_si128(reinterpret_cast<__m128i*>(entries + 4 * i),
                            _mm_cvttps_epi32(_mm_add_ps(_mm_mul_ps(v, scale), half)));
        }
        for (std::size_t i = 0; i < run; ++i) {
            const int32_t* entry = entries + 4 * i;
            const float fx = labTable[entry[0]];
            const float fy = labTable[entry[1]];
            const float fz = labTable[entry[2]];
            ++entryCounts[entry[1]];
            aDiff[i] = fx - fy;
            bDiff[i] = fy - fz;
        }
        std::size_t i = 0;
        for (; i + 4 <= run; i += 4) {
            const __m128 a = _mm256_cvtpd_ps(_mm256_mul_pd(_mm256_cvtps_pd(_mm_load_ps(aDiff + i)), times500));
            const __m128 b = _mm256_cvtpd_ps(_mm256_mul_pd(_mm256_cvtps_pd(_mm_load_ps(bDiff + i)), times200));
            _mm_storeu_ps(pairs + 2 * i, _mm_unpacklo_ps(a, b));
            _mm_storeu_ps(pairs + 2 * i + 4, _mm_unpackhi_ps(a, b));
        }
        for (; i < run; ++i) {
            pairs[2 * i] = static_cast<float>(static_cast<double>(aDiff[i]) * 500.0);
            pairs[2 * i + 1] = static_cast<float>(static_cast<double>(bDiff[i]) * 200.0);
        }
        pixels += 3 * run;
        pairs += 2 * run;
        count -= run;
    }
}

#else

void LabByTables::Avx2Chroma(const uint8_t*, std::size_t, int, float*, int64_t*) const {
    throw std::logic_error("the AVX2 colour kernel is not in this build");
}

#endif

bool LabByTables::Available(VectorKernel kernel) {
    switch (kernel) {
    case VectorKernel::Scalar:
        return true;
    case VectorKernel::Avx2:
#ifdef VORA_AVX2_KERNEL
        return __builtin_cpu_supports("avx2");
#else
        return false;
#endif
    }
    return false;
}

VectorKernel LabByTables::InUse() {
    static const VectorKernel chosen = Available(VectorKernel::Avx2) ? VectorKernel::Avx2 : VectorKernel::Scalar;
    return chosen;
}

const char* LabByTables::Name(VectorKernel kernel) {
    return kernel == VectorKernel::Avx2 ? "avx2" : "scalar";
}

void LabByTables::ChromaOfPixels(VectorKernel kernel, const uint8_t* pixels, std::size_t count, ChannelOrder order,
                                 float* pairs, int64_t* entryCounts) const {
    const int redOffset = order == ChannelOrder::Rgb ? 0 : 2;
    if (kernel == VectorKernel::Avx2 && Available(kernel))
        Avx2Chroma(pixels, count, redOffset, pairs, entryCounts);
    else if (kernel == VectorKernel::Avx2)
        throw std::logic_error("the AVX2 colour kernel is not available here");
    else
        ScalarChroma(pixels, count, redOffset, pairs, entryCounts);
}

}  // namespace vora
