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
};

// The library's apply: validates geometry, prints the faces line for the tile
// at the origin, then runs the worker over bands of whole rows in parallel.
Status ApplyTransfer(const IImage* source, const TRANSFER& transfer, IImage* destination);

// The same work on the calling thread only (for tests and thread-free callers).
Status ApplyTransferSerial(const IImage* source, const TRANSFER& transfer, IImage* destination);

}  // namespace vora
