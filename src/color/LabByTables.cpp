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
// the white point. `rows` holds each channel's 256 rows of four doubles.
__attribute__((target("avx2"))) inline __m128 WhiteScaledXyz(const double* rows, const uint8_t* pixel, int redOffset,
                                                            int blueOffset, __m128 white) {
    const __m256d red = _mm256_load_pd(rows + 4 * pixel[redOffset]);
    const __m256d green = _mm256_load_pd(rows + 4 * (256 + pixel[1]));
    const __m256d blue = _mm256_load_pd(rows + 4 * (512 + pixel[blueOffset]));
    return _mm_mul_ps(_mm256_cvtpd_ps(_mm256_add_pd(_mm256_add_pd(red, green), blue)), white);
}

// TableIndex on four lanes: truncation of v x 3000 + 0.5, each rounded to float.
__attribute__((target("avx2"))) inline __m128i Entries(__m128 v, __m128 scale, __m128 half) {
    return _mm_cvttps_epi32(_mm_add_ps(_mm_mul_ps(v, scale), half));
}

}  // namespace

// Four pixels at a time, each operation the scalar one on four lanes: the
// double sums of a pixel's three rows in one 256-bit addition each, rounded to
// float, transposed to X, Y, Z across pixels, then the white scaling, the
// table index and the differences in the scalar form's precisions. The
// companding lookups stay scalar loads (faster here than gathers). Compiled
// for AVX2 by attribute alone, so no inline function shared with the rest of
// the library is ever compiled with AVX2 instructions.
__attribute__((target("avx2"))) void LabByTables::Avx2Chroma(const uint8_t* pixels, std::size_t count,
                                                            int redOffset, float* pairs,
                                                            int64_t* entryCounts) const {
    const int blueOffset = 2 - redOffset;
    const __m128 white = _mm_set_ps(1.0f, kInvWhiteZ, 1.0f, kInvWhiteX);
    const __m128 scale = _mm_set1_ps(3000.0f);
    const __m128 half = _mm_set1_ps(0.5f);
    const __m256d times500 = _mm256_set1_pd(500.0);
    const __m256d times200 = _mm256_set1_pd(200.0);

    const double* rows = &m_rows[0][0].x;

    std::size_t done = 0;
    for (; done + 4 <= count; done += 4, pixels += 12, pairs += 8) {
        __m128 x = WhiteScaledXyz(rows, pixels, redOffset, blueOffset, white);
        __m128 y = WhiteScaledXyz(rows, pixels + 3, redOffset, blueOffset, white);
        __m128 z = WhiteScaledXyz(rows, pixels + 6, redOffset, blueOffset, white);
        __m128 unused = WhiteScaledXyz(rows, pixels + 9, redOffset, blueOffset, white);
        _MM_TRANSPOSE4_PS(x, y, z, unused);

        alignas(16) int32_t ex[4], ey[4], ez[4];
        _mm_store_si128(reinterpret_cast<__m128i*>(ex), Entries(x, scale, half));
        _mm_store_si128(reinterpret_cast<__m128i*>(ey), Entries(y, scale, half));
        _mm_store_si128(reinterpret_cast<__m128i*>(ez), Entries(z, scale, half));
        const __m128 fx = _mm_set_ps(labTable[ex[3]], labTable[ex[2]], labTable[ex[1]], labTable[ex[0]]);
        const __m128 fy = _mm_set_ps(labTable[ey[3]], labTable[ey[2]], labTable[ey[1]], labTable[ey[0]]);
        const __m128 fz = _mm_set_ps(labTable[ez[3]], labTable[ez[2]], labTable[ez[1]], labTable[ez[0]]);

        const __m128 a = _mm256_cvtpd_ps(_mm256_mul_pd(_mm256_cvtps_pd(_mm_sub_ps(fx, fy)), times500));
        const __m128 b = _mm256_cvtpd_ps(_mm256_mul_pd(_mm256_cvtps_pd(_mm_sub_ps(fy, fz)), times200));
        _mm_storeu_ps(pairs, _mm_unpacklo_ps(a, b));
        _mm_storeu_ps(pairs + 4, _mm_unpackhi_ps(a, b));
        for (int lane = 0; lane < 4; ++lane) ++entryCounts[ey[lane]];
    }
    ScalarChroma(pixels, count - done, redOffset, pairs, entryCounts);
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
