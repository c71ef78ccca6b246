#pragma once

#include <opencv2/core.hpp>

#include "KitApi.h"
#include "color/WorkingOrder.h"

namespace vora {

// Summary of an image's colour, 40 floats. Database styles store entries
// 0..37 and leave the two percentile points at zero.
struct ColourStats {
    float chromaMean[2];     // mean a*, b*
    float chromaSqrtCov[4];  // symmetric square root of the chroma covariance, row-major
    float lightness[32];     // normalised lightness samples, ascending, in [0, 1]
    float lightnessLow;      // L*/100 at the 0.5 % point
    float lightnessHigh;     // L*/100 at the 99.5 % point

    const float* data() const { return chromaMean; }
    float* data() { return chromaMean; }
};
static_assert(sizeof(ColourStats) == 40 * sizeof(float), "ColourStats is 40 packed floats");

// pixels8: CV_8UC3 in B, G, R order (or as `order` says); lab: CV_32FC3 of the
// same size, allocated by the caller, receives (L*/100, a*, b*). Nothing
// happens for zero rows.
VORA_KIT_API void ConvertToLab(const cv::Mat& pixels8, cv::Mat& lab, ChannelOrder order = ChannelOrder::Bgr);

// All 40 entries, straight from 8-bit pixels (CV_8UC3, in the given order):
// the same bits as ConvertToLab followed by ComputeChromaStats and
// ComputeLightnessStats, without the float Lab image. Bands of rows are
// converted on all threads and summed in image order on one. Memory besides
// the image: the chroma of every pixel (8 bytes a pixel, freed on return)
// and lightness counts per thread (24 KiB). The image must hold at least one
// pixel.
VORA_KIT_API void SummariseColours(const cv::Mat& pixels8, ChannelOrder order, ColourStats& stats);

// The same for two images at once, as two calls would give them, with one
// chroma buffer of 8 bytes a pixel of the larger image: the first image's
// second pass runs on one thread while the second image is converted on the
// others, just behind it. Both must hold at least one pixel.
VORA_KIT_API void SummariseColourPair(const cv::Mat& first, const cv::Mat& second, ChannelOrder order,
                                      ColourStats& firstStats, ColourStats& secondStats);

// Entries 0..5. The image must hold at least one pixel. Returns 0.
VORA_KIT_API int ComputeChromaStats(const cv::Mat& lab, ColourStats& stats);

// Entries 6..39. The image must hold at least one pixel. Returns 0.
// A flat image (or a single pixel) normalises every value to 0, and the
// sample index of its first entry would fall one past the end; sample indices
// are clamped into the sorted array, so such an image samples its end values.
//
// Lightness as ConvertToLab gives it takes at most one value per table entry:
// such images are summarised from a histogram of those values, without
// sorting, with the same bits as the sort.
VORA_KIT_API int ComputeLightnessStats(const cv::Mat& lab, ColourStats& stats);

// The histogram form alone: false, with stats unchanged, for an empty image
// or one holding a lightness value no conversion gives.
bool ComputeLightnessStatsFromLevels(const cv::Mat& lab, ColourStats& stats);

// The same by sorting every value: the straightforward form, used for
// lightness values no conversion gives, and the reference the histogram is
// held to.
int ComputeLightnessStatsBySort(const cv::Mat& lab, ColourStats& stats);

// Symmetric square root of a 2x2 CV_32F matrix by SVD: u * diag(sqrt(w)) * vt.
void MatrixSqrt(const cv::Mat& input, cv::Mat& output);

}  // namespace vora
