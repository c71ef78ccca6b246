#pragma once

// A real photograph at 24 megapixels (6000 x 4000) for the benchmarks: the
// largest sample style photo (scripts/fetch-photos.sh), resized with
// INTER_CUBIC and given fine noise (sigma 1.5, fixed seed) so that it has as
// many distinct colours as a camera file.

#include <opencv2/core.hpp>

namespace vora {
namespace bench {

// R, G, B bytes; empty when the sample photos have not been fetched.
const cv::Mat& Photo24();

// Distinct 24-bit colours of an 8-bit three-channel image.
double DistinctColours(const cv::Mat& rgb);

// Peak resident memory (VmHWM) since the last ResetPeakMemory, in bytes;
// 0 where /proc cannot tell.
void ResetPeakMemory();
double PeakMemory();
double CurrentMemory();

}  // namespace bench
}  // namespace vora
