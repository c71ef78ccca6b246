#pragma once

// Rendering a transfer over decoded pixels, and mixing it with the original.

#include <optional>
#include <string>

#include <opencv2/core.hpp>

#include <vora/vora.h>

namespace vora {
namespace cli {

class ProgressBar;

// Rewrites pixels (continuous CV_8UC3 or CV_8UC4, R, G, B first) in place
// with the transfer, in bands of whole rows made with GetTileImageObj; the
// bytes equal those of one whole-image call. The bar, if any, moves from
// fraction `from` to `to` as the bands are done.
void RenderInPlace(const vora_api& api, cv::Mat& pixels, const TRANSFER& transfer, ProgressBar* bar = nullptr,
                   double from = 0.0, double to = 1.0);

// --strength S: how much of a look to use, 0 (the original) to 1 (the whole
// look, the default). Usage error outside [0, 1].
double StrengthOption(const std::optional<std::string>& value);

// Mixes restyled colours with the original ones: each colour byte becomes
// floor(o + S x (r - o) + 0.5), o the original byte, r the restyled one, in
// double precision; bytes from the fourth on (alpha) keep the restyled
// image's, which are the original's. Nothing changes at S = 1. Both images
// have the same size and type (8-bit, 3 or 4 channels).
void MixWithOriginal(const cv::Mat& original, cv::Mat& restyled, double strength);

}  // namespace cli
}  // namespace vora
