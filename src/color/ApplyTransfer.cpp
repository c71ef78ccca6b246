// Applying a transfer to a whole image or a tile: geometry and face boxes are
// prepared once, then a kernel runs over bands of whole rows. Two kernels give
// the same bytes: the plain per-pixel chain, and one that evaluates the chain
// once per distinct colour (outside face boxes a pixel's output depends on its
// colour alone) through a small per-thread cache.
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
inline float LiftFaces(const FaceBox* boxes, const FaceCorrection* faces, size_t faceCount, float px, float py,
                       float base, float a, float b) {
    float lifted = base;
    for (size_t i = 0; i < faceCount; ++i) {
        const FaceBox& box = boxes[i];
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
                lightness = LiftFaces(worker.faceBoxes, faces, faceCount, px, py, lightness, chroma.a, chroma.b);
            }
            const Rgb8 rgb = LabToRgb(lightness, chroma.a, chroma.b);
            out[0] = rgb.red;
            out[1] = rgb.green;
            out[2] = rgb.blue;
            // Bytes from 3 on (alpha, padding) are left as they are.
        }
    }
}

// The output of a pixel outside every face box, packed as R << 16 | G << 8 | B:
// the plain kernel's chain without the face step. The conversion by tables
// has RgbToLab's bits for every colour and costs less on each cache miss.
inline uint32_t TransferColour(const LabByTables& toLab, const TRANSFER& transfer, uint8_t red, uint8_t green,
                               uint8_t blue) {
    std::size_t lightnessEntry;
    const LabPixel lab = toLab(red, green, blue, lightnessEntry);
    const float lightness = ToneCurveLookup(
        transfer.toneCurve, NormaliseLightness(lab.lightness01, transfer.lightnessLow, transfer.lightnessHigh));
    const ChromaPixel chroma = MapChroma(transfer.contentMean, transfer.chromaMatrix, transfer.styleMean, lab.a, lab.b);
    const Rgb8 rgb = LabToRgb(lightness, chroma.a, chroma.b);
    return static_cast<uint32_t>(rgb.red) << 16 | static_cast<uint32_t>(rgb.green) << 8 | rgb.blue;
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

// The cached kernel. Rows that meet no face box take every pixel from the
// cache; in rows that do, pixels inside a box take the plain chain with the
// faces whose boxes meet the row, in record order (the others cannot contain
// the pixel, so the maximum over faces is unchanged).
void RunBandCached(const ApplyTransferWorker& worker, ColourCache& cache, size_t rowBegin, size_t rowEnd,
                   size_t columnBegin, size_t columnEnd) {
    const TRANSFER& transfer = worker.transfer;
    const size_t faceCount = worker.faceBoxes ? std::min(worker.faceCount, transfer.faceCorrections.size()) : 0;
    const size_t pixelStride = worker.pixelStride;
    const LabByTables& toLab = LabByTables::Get();
    std::vector<FaceBox> rowBoxes;
    std::vector<FaceCorrection> rowFaces;
    rowBoxes.reserve(faceCount);
    rowFaces.reserve(faceCount);

    for (size_t r = rowBegin; r < rowEnd; ++r) {
        rowBoxes.clear();
        rowFaces.clear();
        const float py = faceCount > 0 ? FullImagePosition(worker.tileTop, r, worker.fullHeight) : 0.0f;
        for (size_t i = 0; i < faceCount; ++i) {
            const FaceBox& box = worker.faceBoxes[i];
            if (py > box.yLow && py < box.yHigh) {
                rowBoxes.push_back(box);
                rowFaces.push_back(transfer.faceCorrections[i]);
            }
        }
        const size_t offset = r * worker.rowStride + columnBegin * pixelStride;
        const uint8_t* in = worker.source + offset;
        uint8_t* out = worker.destination + offset;
        for (size_t c = columnBegin; c < columnEnd; ++c, in += pixelStride, out += pixelStride) {
            const uint8_t red = in[0], green = in[1], blue = in[2];
            if (!rowBoxes.empty()) {
                const float px = FullImagePosition(worker.tileLeft, c, worker.fullWidth);
                bool inside = false;
                for (const FaceBox& box : rowBoxes) inside = inside || (px > box.xLow && px < box.xHigh);
                if (inside) {
                    const LabPixel lab = RgbToLab(red, green, blue);
                    const float base = ToneCurveLookup(
                        transfer.toneCurve,
                        NormaliseLightness(lab.lightness01, transfer.lightnessLow, transfer.lightnessHigh));
                    const ChromaPixel chroma =
                        MapChroma(transfer.contentMean, transfer.chromaMatrix, transfer.styleMean, lab.a, lab.b);
                    const float lightness = LiftFaces(rowBoxes.data(), rowFaces.data(), rowBoxes.size(), px, py,
                                                      base, chroma.a, chroma.b);
                    const Rgb8 rgb = LabToRgb(lightness, chroma.a, chroma.b);
                    out[0] = rgb.red;
                    out[1] = rgb.green;
                    out[2] = rgb.blue;
                    continue;
                }
            }
            const uint32_t key = static_cast<uint32_t>(red) << 16 | static_cast<uint32_t>(green) << 8 | blue;
            const uint32_t rgb = cache.Get(key, [&] { return TransferColour(toLab, transfer, red, green, blue); });
            out[0] = static_cast<uint8_t>(rgb >> 16);
            out[1] = static_cast<uint8_t>(rgb >> 8);
            out[2] = static_cast<uint8_t>(rgb);
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
    const std::vector<FaceBox> faceBoxes = MakeFaceBoxes(transfer);

    // Only the tile at the origin reports, so a tiled image prints the line once.
    const int faceCount = static_cast<int>(transfer.faceCorrections.size());
    if (topLeft.left == 0 && topLeft.top == 0 && faceCount >= 1) std::printf(kCorrectFacesMessage, faceCount);

    if (empty) return;

    ApplyTransferWorker worker{rows, columns, source->GetRowStride(), source->GetPixelStride(),
                               source->GetConstData(), transfer, destination->GetData(),
                               topLeft.left, topLeft.top, fullResSize.width, fullResSize.height,
                               faceBoxes.size(), faceBoxes.data(), nullptr};

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

std::vector<FaceBox> MakeFaceBoxes(const TRANSFER& transfer) {
    std::vector<FaceBox> boxes;
    boxes.reserve(transfer.faceCorrections.size());
    for (const FaceCorrection& face : transfer.faceCorrections) {
        // Each bound is computed in float and only then widened.
        const float xLow = face.centreX - face.halfSizeX * 2.5f;
        const float xHigh = face.centreX + face.halfSizeX * 2.5f;
        const float yLow = face.centreY - face.halfSizeY * 2.5f;
        const float yHigh = face.centreY + face.halfSizeY * 2.5f;
        boxes.push_back(FaceBox{xLow, xHigh, yLow, yHigh});
    }
    return boxes;
}

void ApplyTransferWorker::Run(size_t rowBegin, size_t rowEnd, size_t columnBegin, size_t columnEnd) const {
    if (caches != nullptr) {
        RunBandCached(*this, caches->local(), rowBegin, rowEnd, columnBegin, columnEnd);
        return;
    }
    // A worker never reads past the face entries of its own record.
    if (std::min(faceCount, transfer.faceCorrections.size()) > 0 && faceBoxes != nullptr) {
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
