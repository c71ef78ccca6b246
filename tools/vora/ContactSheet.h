#pragma once

// One picture to judge proposals at a glance: the original and each proposal
// side by side, labelled, with the faces that were passed to the library
// outlined.

#include <string>
#include <vector>

#include <opencv2/core.hpp>

#include "vora/TransferJson.h"

namespace vora {
namespace cli {

struct SheetEntry {
    cv::Mat thumbnail;  // CV_8UC3 R, G, B
    std::string title;  // "1  style 12"
    std::string detail; // "cluster 3"
};

// A CV_8UC3 copy of an RGB or RGBA image whose long side is at most maxSide.
cv::Mat MakeThumbnail(const cv::Mat& rgbOrRgba, int maxSide);

// R, G, B sheet: a heading line, then the entries in a grid.
cv::Mat ComposeContactSheet(const std::string& heading, const std::vector<SheetEntry>& entries,
                            const std::vector<CFaceRect>& faces);

}  // namespace cli
}  // namespace vora
