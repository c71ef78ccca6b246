#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include <vora/vora.h>

namespace vora {

// A face lift region in normalised full-image coordinates.
struct FaceBox {
    double xLow;
    double xHigh;
    double yLow;
    double yHigh;
};

// Builds one box per face correction (centre +- 2.5 half-sizes, in float, then widened).
std::vector<FaceBox> MakeFaceBoxes(const TRANSFER& transfer);

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
    const FaceBox* faceBoxes;

    // Rewrites rows [rowBegin, rowEnd) and columns [columnBegin, columnEnd).
    void Run(size_t rowBegin, size_t rowEnd, size_t columnBegin, size_t columnEnd) const;

    // Entry point for tbb::parallel_for over a blocked_range2d (rows, columns);
    // a template so that this header needs no TBB include.
    template <class Range2d>
    void operator()(const Range2d& range) const {
        Run(range.rows().begin(), range.rows().end(), range.cols().begin(), range.cols().end());
    }
};

// The library's apply: validates geometry, prints the faces line for the tile
// at the origin, then runs the worker over bands of whole rows in parallel.
//
// Returns STATUS_OK, having changed nothing, when the source has zero rows or
// zero columns. Returns STATUS_INVALID_ARGUMENT, having written no pixel and
// printed nothing, for input that would otherwise be read or written out of
// bounds: a null source or destination object; a null source or destination
// pixel pointer; a destination whose width, height, row stride or pixel
// stride differs from the source's; a pixel stride below 3; a row stride
// shorter than a row of pixels.
Status ApplyTransfer(const IImage* source, const TRANSFER& transfer, IImage* destination);

// The same work on the calling thread only (for tests and thread-free callers).
Status ApplyTransferSerial(const IImage* source, const TRANSFER& transfer, IImage* destination);

}  // namespace vora
