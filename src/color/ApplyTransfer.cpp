// Applying a transfer to a whole image or a tile: geometry and face boxes are
// prepared once, then a kernel runs over bands of whole rows. Two kernels give
// the same bytes: the plain per-pixel chain, and one that evaluates the chain
// once per distinct colour (outside face boxes a pixel's output depends on its
// colour alone) through a small per-thread cache, computing missed colours
// in batches.
#include "color/ApplyTransfer.h"

#include <algorithm>
#include <cassert>
#include <cmath>
#include <cstdio>

#include <tbb/blocked_range2d.h>
#include <tbb/enumerable_thread_specific.h>
#include <tbb/parallel_for.h>
#include <tbb/partitioner.h>
#include <tbb/task_group.h>

#include "color/ColorConversion.h"
#include "color/LabByTables.h"
#include "color/PixelTransfer.h"
#include "color/TransferColours.h"

#ifdef VORA_AVX2_KERNEL
#include <immintrin.h>
#endif

namespace vora {
namespace {

// The one diagnostic of apply, printed once per tiled image (by its origin tile).
constexpr char kCorrectFacesMessage[] = "Correct %d faces!!\n";

// A position in the full image, normalised to 0..1: the tile origin plus the
// pixel index, each sum converted to float and divided in float.
inline float FullImagePosition(size_t tileOrigin, size_t index, size_t fullExtent) {
    return static_cast<float>(tileOrigin + index) / static_cast<float>(fullExtent);
}

// Lifts the lightness of a pixel inside face boxes. Every face starts from the
// same base and overlapping faces combine by maximum, so face order does not
// matter. Box edges are outside (strict comparisons, in double).
inline float LiftFaces(const CorrectionBox* boxes, const FaceCorrection* faces, size_t faceCount, float px, float py,
                       float base, float a, float b) {
    float lifted = base;
    for (size_t i = 0; i < faceCount; ++i) {
        const CorrectionBox& box = boxes[i];
        if (px > box.xLow && px < box.xHigh && py > box.yLow && py < box.yHigh) {
            const FaceCorrection& face = faces[i];
            const float dx = (px - face.centreX) / face.halfSizeX;
            const float dy = (py - face.centreY) / face.halfSizeY;
            const float da = face.measuredA - a;
            const float db = face.measuredB - b;
            const float weight = expf((da * da + db * db) / -1000.0f - (dx * dx + dy * dy) / 2.2f);
            const float candidate = powf(base, face.exponent) * weight + (1.0f - weight) * base;
            lifted = std::max(candidate, lifted);
        }
    }
    return lifted;
}

// The kernel; the face variant is chosen once per band, not per pixel.
template <bool kWithFaces>
void RunBand(const ApplyTransferWorker& worker, size_t rowBegin, size_t rowEnd, size_t columnBegin,
             size_t columnEnd) {
    const TRANSFER& transfer = worker.transfer;
    const float low = transfer.lightnessLow;
    const float high = transfer.lightnessHigh;
    const FaceCorrection* faces = transfer.faceCorrections.data();
    const size_t faceCount = std::min(worker.faceCount, transfer.faceCorrections.size());
    const size_t pixelStride = worker.pixelStride;

    for (size_t r = rowBegin; r < rowEnd; ++r) {
        const size_t offset = r * worker.rowStride + columnBegin * pixelStride;
        const uint8_t* in = worker.source + offset;
        uint8_t* out = worker.destination + offset;
        float py = 0.0f;
        if constexpr (kWithFaces) py = FullImagePosition(worker.tileTop, r, worker.fullHeight);
        for (size_t c = columnBegin; c < columnEnd; ++c, in += pixelStride, out += pixelStride) {
            // All three source bytes are read before any destination byte is
            // written, so source and destination may be the same memory.
            const LabPixel lab = RgbToLab(in[0], in[1], in[2]);
            float lightness = ToneCurveLookup(transfer.toneCurve, NormaliseLightness(lab.lightness01, low, high));
            const ChromaPixel chroma =
                MapChroma(transfer.contentMean, transfer.chromaMatrix, transfer.styleMean, lab.a, lab.b);
            if constexpr (kWithFaces) {
                const float px = FullImagePosition(worker.tileLeft, c, worker.fullWidth);
                lightness = LiftFaces(worker.correctionBoxes, faces, faceCount, px, py, lightness, chroma.a, chroma.b);
            }
            const Rgb8 rgb = LabToRgb(lightness, chroma.a, chroma.b);
            out[0] = rgb.red;
            out[1] = rgb.green;
            out[2] = rgb.blue;
            // Bytes from 3 on (alpha, padding) are left as they are.
        }
    }
}

// Writes a packed R << 16 | G << 8 | B output into a pixel's first three bytes.
inline void WritePacked(uint8_t* pixel, uint32_t rgb) {
    pixel[0] = static_cast<uint8_t>(rgb >> 16);
    pixel[1] = static_cast<uint8_t>(rgb >> 8);
    pixel[2] = static_cast<uint8_t>(rgb);
}

}  // namespace

ColourCache::ColourCache(unsigned bits) : m_shift(32 - bits), m_entries(size_t{1} << bits, 0) {}

unsigned ColourCacheBits(size_t pixels) {
    if (pixels < kColourCacheMinPixels) return 0;
    // About one entry for every 16 pixels: a tile pays for its own size only.
    unsigned bits = 0;
    while (bits < kColourCacheMaxBits && (size_t{16} << bits) < pixels) ++bits;
    return std::max(bits, kColourCacheMinBits);
}

namespace {

// Pixels per batch of the cached kernel's rows without faces.
constexpr size_t kBatch = 512;

// The first pass of RunBatch over pixels [first, end): each colour into
// colours[i], what its entry holds into the pixel, and the index of each
// miss into `missed`; returns the number of misses.
size_t LookUp(ColourCache& cache, const uint8_t* source, uint8_t* destination, size_t first, size_t end,
              size_t pixelStride, uint32_t* colours, uint32_t* missed) {
    uint64_t entries[kBatch];
    // Loads only, so that many lookups are in flight at once.
    for (size_t i = first; i < end; ++i) {
        const uint8_t* pixel = source + i * pixelStride;
        colours[i] = PackRgb(pixel[0], pixel[1], pixel[2]);
        entries[i] = cache.Slot(colours[i]);
    }
    // Every colour was read before any pixel is written: in place is safe.
    size_t misses = 0;
    for (size_t i = first; i < end; ++i) {
        missed[misses] = static_cast<uint32_t>(i);
        misses += ColourCache::Holds(entries[i], colours[i]) ? 0 : 1;
        WritePacked(destination + i * pixelStride, ColourCache::Output(entries[i]));
    }
    return misses;
}

#ifdef VORA_AVX2_KERNEL
// LookUp over `count` (a multiple of 8) pixels of three bytes, eight at a
// time: the colours by a byte shuffle, the entries by two gathers. Each group
// of 24 bytes is read whole before it is written, so in place is safe.
__attribute__((target("avx2"))) size_t LookUpAvx2(const ColourCache& cache, const uint8_t* source,
                                                  uint8_t* destination, size_t count, uint32_t* colours,
                                                  uint32_t* missed) {
    // Pixels 0-3 from bytes 0-11 of the low half, 4-7 from bytes 4-15 of the
    // high half (loaded from byte 8), each as 0, R, G, B.
    const __m256i toColours = _mm256_setr_epi8(2, 1, 0, -128, 5, 4, 3, -128, 8, 7, 6, -128, 11, 10, 9, -128,  //
                                               6, 5, 4, -128, 9, 8, 7, -128, 12, 11, 10, -128, 15, 14, 13, -128);
    // Back to R, G, B bytes: twelve per half, then the halves joined.
    const __m256i toBytes = _mm256_setr_epi8(2, 1, 0, 6, 5, 4, 10, 9, 8, 14, 13, 12, -128, -128, -128, -128,  //
                                             2, 1, 0, 6, 5, 4, 10, 9, 8, 14, 13, 12, -128, -128, -128, -128);
    const __m256i joinBytes = _mm256_setr_epi32(0, 1, 2, 4, 5, 6, 3, 7);
    const __m256i lowsThenHighs = _mm256_setr_epi32(0, 2, 4, 6, 1, 3, 5, 7);
    const __m256i multiplier = _mm256_set1_epi32(static_cast<int>(ColourCache::kMultiplier));
    const __m256i tagBit = _mm256_set1_epi32(static_cast<int>(ColourCache::kTagBit));
    const __m128i shift = _mm_cvtsi32_si128(static_cast<int>(cache.Shift()));
    const long long* entries = reinterpret_cast<const long long*>(cache.Entries());

    size_t misses = 0;
    for (size_t i = 0; i < count; i += 8) {
        const uint8_t* pixels = source + 3 * i;
        const __m256i bytes = _mm256_set_m128i(_mm_loadu_si128(reinterpret_cast<const __m128i*>(pixels + 8)),
                                               _mm_loadu_si128(reinterpret_cast<const __m128i*>(pixels)));
        const __m256i colour = _mm256_shuffle_epi8(bytes, toColours);
        _mm256_storeu_si256(reinterpret_cast<__m256i*>(colours + i), colour);
        const __m256i slots = _mm256_srl_epi32(_mm256_mullo_epi32(colour, multiplier), shift);
        const __m256i low = _mm256_permutevar8x32_epi32(
            _mm256_i32gather_epi64(entries, _mm256_castsi256_si128(slots), 8), lowsThenHighs);
        const __m256i high = _mm256_permutevar8x32_epi32(
            _mm256_i32gather_epi64(entries, _mm256_extracti128_si256(slots, 1), 8), lowsThenHighs);
        const __m256i outputs = _mm256_permute2x128_si256(low, high, 0x20);
        const __m256i tags = _mm256_permute2x128_si256(low, high, 0x31);
        const __m256i hits = _mm256_cmpeq_epi32(tags, _mm256_or_si256(colour, tagBit));
        for (unsigned miss = ~static_cast<unsigned>(_mm256_movemask_ps(_mm256_castsi256_ps(hits))) & 0xFFu; miss != 0;
             miss &= miss - 1)
            missed[misses++] = static_cast<uint32_t>(i + static_cast<unsigned>(__builtin_ctz(miss)));
        const __m256i packed = _mm256_permutevar8x32_epi32(_mm256_shuffle_epi8(outputs, toBytes), joinBytes);
        uint8_t* written = destination + 3 * i;
        _mm_storeu_si128(reinterpret_cast<__m128i*>(written), _mm256_castsi256_si128(packed));
        _mm_storel_epi64(reinterpret_cast<__m128i*>(written + 16), _mm256_extracti128_si256(packed, 1));
    }
    return misses;
}
#else
size_t LookUpAvx2(const ColourCache&, const uint8_t*, uint8_t*, size_t, uint32_t*, uint32_t*) { return 0; }
#endif


// A run of pixels of one row outside every face box, in three passes. The
// first looks every colour up and writes what its entry holds, noting the
// misses without a branch; the second computes the missed colours together
// (TransferColours); the third stores them and rewrites those pixels. A colour
// missed twice in a batch is computed twice, to the same bytes.
void RunBatch(ColourCache& cache, VectorKernel kernel, const TRANSFER& transfer, const uint8_t* in, uint8_t* out,
              size_t count, size_t pixelStride) {
    uint32_t colours[kBatch], missed[kBatch], missColours[kBatch], missOutputs[kBatch];
    const bool vector = kernel == VectorKernel::Avx2 && pixelStride == 3;
    for (size_t done = 0; done < count; done += kBatch) {
        const size_t n = std::min(kBatch, count - done);
        const uint8_t* source = in + done * pixelStride;
        uint8_t* destination = out + done * pixelStride;
        const size_t looked = vector ? n & ~size_t{7} : 0;
        size_t misses = looked > 0 ? LookUpAvx2(cache, source, destination, looked, colours, missed) : 0;
        misses += LookUp(cache, source, destination, looked, n, pixelStride, colours, missed + misses);
        for (size_t j = 0; j < misses; ++j) missColours[j] = colours[missed[j]];
        TransferColours(kernel, transfer, missColours, misses, missOutputs);
        for (size_t j = 0; j < misses; ++j) {
            cache.Slot(missColours[j]) = ColourCache::Entry(missColours[j], missOutputs[j]);
            WritePacked(destination + missed[j] * pixelStride, missOutputs[j]);
        }
    }
}

// A run of `count` pixels of one row, from column `column` on, inside the
// boxes of `faces` (those that meet the row): the plain kernel's chain,
// evaluated as TransferColours does with each pixel's face lift between the
// transfer and the conversion back to RGB. Each batch's colours are read
// before any pixel is written, so in place is safe.
void RunLiftedBatch(const ApplyTransferWorker& worker, const std::vector<CorrectionBox>& boxes,
                    const std::vector<FaceCorrection>& faces, float py, VectorKernel kernel, const uint8_t* in,
                    uint8_t* out, size_t column, size_t count) {
    uint32_t colours[kBatch], outputs[kBatch];
    float px[kBatch];
    const size_t pixelStride = worker.pixelStride;
    const LightnessLift lift = [&](size_t first, size_t n, float* lightness, const float* a, const float* b) {
        for (size_t i = 0; i < n; ++i)
            lightness[i] = LiftFaces(boxes.data(), faces.data(), boxes.size(), px[first + i], py, lightness[i], a[i],
                                     b[i]);
    };
    for (size_t done = 0; done < count; done += kBatch) {
        const size_t n = std::min(kBatch, count - done);
        for (size_t i = 0; i < n; ++i) {
            const uint8_t* pixel = in + (done + i) * pixelStride;
            colours[i] = PackRgb(pixel[0], pixel[1], pixel[2]);
            px[i] = FullImagePosition(worker.tileLeft, column + done + i, worker.fullWidth);
        }
        TransferColours(kernel, worker.transfer, colours, n, outputs, &lift);
        for (size_t i = 0; i < n; ++i) WritePacked(out + (done + i) * pixelStride, outputs[i]);
    }
}

// The cached kernel. Rows that meet no face box go through RunBatch; in rows
// that do, pixels inside a box take the chain with the faces whose boxes meet
// the row, in record order (the others cannot contain the pixel, so the
// maximum over faces is unchanged), and runs of the others RunBatch.
void RunBandCached(const ApplyTransferWorker& worker, ColourCache& cache, size_t rowBegin, size_t rowEnd,
                   size_t columnBegin, size_t columnEnd) {
    const TRANSFER& transfer = worker.transfer;
    const size_t faceCount = worker.correctionBoxes ? std::min(worker.faceCount, transfer.faceCorrections.size()) : 0;
    const size_t pixelStride = worker.pixelStride;
    const VectorKernel kernel = LabByTables::InUse();
    std::vector<CorrectionBox> rowBoxes;
    std::vector<FaceCorrection> rowFaces;
    rowBoxes.reserve(faceCount);
    rowFaces.reserve(faceCount);

    for (size_t r = rowBegin; r < rowEnd; ++r) {
        rowBoxes.clear();
        rowFaces.clear();
        const float py = faceCount > 0 ? FullImagePosition(worker.tileTop, r, worker.fullHeight) : 0.0f;
        for (size_t i = 0; i < faceCount; ++i) {
            const CorrectionBox& box = worker.correctionBoxes[i];
            if (py > box.yLow && py < box.yHigh) {
                rowBoxes.push_back(box);
                rowFaces.push_back(transfer.faceCorrections[i]);
            }
        }
        const size_t offset = r * worker.rowStride + columnBegin * pixelStride;
        const uint8_t* in = worker.source + offset;
        uint8_t* out = worker.destination + offset;
        if (rowBoxes.empty()) {
            RunBatch(cache, kernel, transfer, in, out, columnEnd - columnBegin, pixelStride);
            continue;
        }
        // Runs of pixels outside every box go through RunBatch; runs inside
        // take the chain with the faces' lift, also in batches.
        const auto inside = [&](size_t c) {
            const float px = FullImagePosition(worker.tileLeft, c, worker.fullWidth);
            for (const CorrectionBox& box : rowBoxes)
                if (px > box.xLow && px < box.xHigh) return true;
            return false;
        };
        for (size_t c = columnBegin; c < columnEnd;) {
            const bool lifted = inside(c);
            size_t end = c + 1;
            while (end < columnEnd && inside(end) == lifted) ++end;
            const size_t skip = (c - columnBegin) * pixelStride;
            if (lifted)
                RunLiftedBatch(worker, rowBoxes, rowFaces, py, kernel, in + skip, out + skip, c, end - c);
            else
                RunBatch(cache, kernel, transfer, in + skip, out + skip, end - c, pixelStride);
            c = end;
        }
    }
}

enum class Threading { Parallel, Serial };

void Apply(const IImage* source, const TRANSFER& transfer, IImage* destination, Threading threading,
           ApplyKernel kernel) {
    assert(source != nullptr && destination != nullptr);
    const size_t rows = source->GetHeight();
    const size_t columns = source->GetWidth();
    const bool empty = rows == 0 || columns == 0;
    assert(empty || (source->GetConstData() != nullptr && destination->GetData() != nullptr &&
                     destination->GetRowStride() == source->GetRowStride() &&
                     destination->GetPixelStride() == source->GetPixelStride() &&
                     destination->GetWidth() == columns && destination->GetHeight() == rows &&
                     source->GetPixelStride() >= 3 && columns <= source->GetRowStride() / source->GetPixelStride()));

    const CTopLeftCoordinate topLeft = source->GetTopLeft();
    const CFullResImageSize fullResSize = source->GetFullResSize();
    const std::vector<CorrectionBox> correctionBoxes = MakeCorrectionBoxes(transfer);

    // Only the tile at the origin reports, so a tiled image prints the line once.
    const int faceCount = static_cast<int>(transfer.faceCorrections.size());
    if (topLeft.left == 0 && topLeft.top == 0 && faceCount >= 1) std::printf(kCorrectFacesMessage, faceCount);

    if (empty) return;

    ApplyTransferWorker worker{rows, columns, source->GetRowStride(), source->GetPixelStride(),
                               source->GetConstData(), transfer, destination->GetData(),
                               topLeft.left, topLeft.top, fullResSize.width, fullResSize.height,
                               correctionBoxes.size(), correctionBoxes.data(), nullptr};

    // The cache is sized by the work of this call and lives only as long as it.
    const unsigned cacheBits = kernel == ApplyKernel::Plain ? 0 : ColourCacheBits(rows * columns);
    tbb::enumerable_thread_specific<ColourCache> caches([cacheBits] { return ColourCache(cacheBits); });
    if (cacheBits > 0) worker.caches = &caches;

    if (threading == Threading::Serial) {
        worker.Run(0, rows, 0, columns);
    } else {
        // Column grain = width: a range is never split across columns, so every
        // task gets a band of whole rows.
        tbb::task_group_context context;
        tbb::parallel_for(tbb::blocked_range2d<size_t, size_t>(0, rows, 1, 0, columns, columns), worker,
                          tbb::auto_partitioner(), context);
    }
}

}  // namespace

std::vector<CorrectionBox> MakeCorrectionBoxes(const TRANSFER& transfer) {
    std::vector<CorrectionBox> boxes;
    boxes.reserve(transfer.faceCorrections.size());
    for (const FaceCorrection& face : transfer.faceCorrections) {
        // Each bound is computed in float and only then widened.
        const float xLow = face.centreX - face.halfSizeX * 2.5f;
        const float xHigh = face.centreX + face.halfSizeX * 2.5f;
        const float yLow = face.centreY - face.halfSizeY * 2.5f;
        const float yHigh = face.centreY + face.halfSizeY * 2.5f;
        boxes.push_back(CorrectionBox{xLow, xHigh, yLow, yHigh});
    }
    return boxes;
}

void ApplyTransferWorker::Run(size_t rowBegin, size_t rowEnd, size_t columnBegin, size_t columnEnd) const {
    if (caches != nullptr) {
        RunBandCached(*this, caches->local(), rowBegin, rowEnd, columnBegin, columnEnd);
        return;
    }
    // A worker never reads past the face entries of its own record.
    if (std::min(faceCount, transfer.faceCorrections.size()) > 0 && correctionBoxes != nullptr) {
        RunBand<true>(*this, rowBegin, rowEnd, columnBegin, columnEnd);
    } else {
        RunBand<false>(*this, rowBegin, rowEnd, columnBegin, columnEnd);
    }
}

void ApplyTransfer(const IImage* source, const TRANSFER& transfer, IImage* destination, ApplyKernel kernel) {
    Apply(source, transfer, destination, Threading::Parallel, kernel);
}

void ApplyTransferSerial(const IImage* source, const TRANSFER& transfer, IImage* destination, ApplyKernel kernel) {
    Apply(source, transfer, destination, Threading::Serial, kernel);
}

}  // namespace vora
