#include "vora/Rendering.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <new>
#include <vector>

#include "vora/Cli.h"
#include "vora/Library.h"
#include "vora/ProgressBar.h"

namespace vora {
namespace cli {

void RenderInPlace(const vora_api& api, cv::Mat& pixels, const TRANSFER& transfer, ProgressBar* bar, double from,
                   double to) {
    CV_Assert(pixels.depth() == CV_8U && pixels.isContinuous() && (pixels.channels() == 3 || pixels.channels() == 4));
    const size_t width = static_cast<size_t>(pixels.cols), height = static_cast<size_t>(pixels.rows);
    const size_t channels = static_cast<size_t>(pixels.channels());
    // Bands of about a million pixels: small enough for a smooth progress bar,
    // large enough that the library's threads have rows to share.
    const size_t bandRows = std::max<size_t>(1, std::min(height, (size_t{1} << 20) / std::max<size_t>(width, 1)));
    const size_t layout[4] = {0, 0, 0, 0};
    for (size_t top = 0; top < height; top += bandRows) {
        const size_t rows = std::min(bandRows, height - top);
        uint8_t* first = pixels.data + top * width * channels;
        ImageHandle tile(GetTileImageObj(rows, width, channels, layout, first, CFullResImageSize(width, height),
                                         CTopLeftCoordinate(0, top)));
        if (!tile) throw std::bad_alloc();
        CheckStatus(api.apply_transfer(tile.get(), transfer, tile.get()), "apply");
        if (bar) bar->Update(from + (to - from) * static_cast<double>(top + rows) / static_cast<double>(height));
    }
}

double StrengthOption(const std::optional<std::string>& value) {
    if (!value) return 1.0;
    (void)ParseFactor(*value, "--strength", 0.0, false, 1.0);  // the checks and their messages
    return std::strtod(value->c_str(), nullptr);                // the mix is in double: the value as written
}

void MixWithOriginal(const cv::Mat& original, cv::Mat& restyled, double strength) {
    if (strength == 1.0) return;
    // The result depends on the byte pair alone: one table for the call.
    std::vector<uint8_t> mixed(256 * 256);
    for (int o = 0; o < 256; ++o)
        for (int r = 0; r < 256; ++r)
            mixed[static_cast<size_t>(o) * 256 + static_cast<size_t>(r)] =
                static_cast<uint8_t>(std::floor(o + strength * (r - o) + 0.5));
    const int channels = restyled.channels();
    for (int y = 0; y < restyled.rows; ++y) {
        const uint8_t* from = original.ptr<uint8_t>(y);
        uint8_t* to = restyled.ptr<uint8_t>(y);
        for (int x = 0; x < restyled.cols; ++x, from += channels, to += channels)
            for (int c = 0; c < 3; ++c) to[c] = mixed[static_cast<size_t>(from[c]) * 256 + to[c]];
    }
}

}  // namespace cli
}  // namespace vora
