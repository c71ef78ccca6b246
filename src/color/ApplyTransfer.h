#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include <tbb/enumerable_thread_specific.h>
#include <vora/vora.h>

namespace vora {

// The region a face correction lifts, in normalised full-image coordinates
// (not a detected face: see MakeCorrectionBoxes).
struct CorrectionBox {
    double xLow;
    double xHigh;
    double yLow;
    double yHigh;
};

// A direct-mapped cache of the colour function of a transfer outside face
// boxes: 2^bits entries of 8 bytes, each a 24-bit colour (tagged) and its
// 24-bit output. A miss overwrites the entry, so the memory is fixed.
class ColourCache {
public:
    explicit ColourCache(unsigned bits);  // 1 <= bits <= 31

    // The entry that `colour` (R << 16 | G << 8 | B) maps to: the top bits of
    // colour x kMultiplier (mod 2^32) index the entries.
    static constexpr uint32_t kMultiplier = 0x9E3779B1u;
    static constexpr uint32_t kTagBit = 0x80000000u;
    uint64_t& Slot(uint32_t colour) { return m_entries[(colour * kMultiplier) >> m_shift]; }
    static bool Holds(uint64_t entry, uint32_t colour) { return static_cast<uint32_t>(entry >> 32) == Tag(colour); }
    static uint32_t Output(uint64_t entry) { return static_cast<uint32_t>(entry); }
    static uint64_t Entry(uint32_t colour, uint32_t output) { return static_cast<uint64_t>(Tag(colour)) << 32 | output; }

    // For the vector lookup, which computes the index and tag the same way.
    const uint64_t* Entries() const { return m_entries.data(); }
    unsigned Shift() const { return m_shift; }

private:
    static uint32_t Tag(uint32_t colour) { return colour | kTagBit; }  // never 0, the empty entry

    unsigned m_shift;
    std::vector<uint64_t> m_entries;
};

// Below this many pixels a call runs the plain kernel: filling a cache would
// cost more than it saves.
constexpr size_t kColourCacheMinPixels = size_t{1} << 15;
constexpr unsigned kColourCacheMinBits = 10;
// 2^18 entries: 2 MiB per thread, the most a call keeps.
constexpr unsigned kColourCacheMaxBits = 18;

// The cache size for a call over `pixels` pixels: 0 (no cache) below
// kColourCacheMinPixels, else about one entry for every 16 pixels, within
// [kColourCacheMinBits, kColourCacheMaxBits].
unsigned ColourCacheBits(size_t pixels);

// Which kernel apply runs. Both give the same bytes; Plain is the
// straightforward per-pixel form, kept as the reference the other is held to.
enum class ApplyKernel { Fastest, Plain };

// Builds one box per face correction (centre +- 2.5 half-sizes, in float, then widened).
std::vector<CorrectionBox> MakeCorrectionBoxes(const TRANSFER& transfer);

// Body of the parallel loop: everything a band of rows needs, copied per task.
// Both buffers are addressed with the source's strides.
struct ApplyTransferWorker {
    size_t rows;
    size_t columns;
    size_t rowStride;
    size_t pixelStride;
    const uint8_t* source;
    TRANSFER transfer;
    uint8_t* destination;
    size_t tileLeft;
    size_t tileTop;
    size_t fullWidth;
    size_t fullHeight;
    size_t faceCount;
    const CorrectionBox* correctionBoxes;
    // Per-thread colour caches; null runs the plain kernel.
    tbb::enumerable_thread_specific<ColourCache>* caches;

    // Rewrites rows [rowBegin, rowEnd) and columns [columnBegin, columnEnd).
    void Run(size_t rowBegin, size_t rowEnd, size_t columnBegin, size_t columnEnd) const;

    // Entry point for tbb::parallel_for over a blocked_range2d (rows, columns);
    // a template so that this header needs no TBB include.
    template <class Range2d>
    void operator()(const Range2d& range) const {
        Run(range.rows().begin(), range.rows().end(), range.cols().begin(), range.cols().end());
    }
};

// The library's apply: prints the faces line for the tile at the origin, then
// runs the worker over bands of whole rows in parallel.
//
// The caller has checked the arguments (the facade's CheckApplyArguments):
// both objects exist and, unless the source has zero rows or columns (then
// nothing is read or written), both have pixels, the same width, height and
// strides, a pixel stride of at least 3 and rows no closer than a row of
// pixels. Debug builds assert this.
//
// A call over at least kColourCacheMinPixels pixels keeps, per thread that
// takes part, a colour cache of 8 << ColourCacheBits(pixels) bytes (at most
// 2 MiB), freed before it returns.
void ApplyTransfer(const IImage* source, const TRANSFER& transfer, IImage* destination,
                   ApplyKernel kernel = ApplyKernel::Fastest);

// The same work on the calling thread only (for tests and thread-free callers).
void ApplyTransferSerial(const IImage* source, const TRANSFER& transfer, IImage* destination,
                         ApplyKernel kernel = ApplyKernel::Fastest);

}  // namespace vora
