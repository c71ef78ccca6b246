#include "vora/ContactSheet.h"

#include <algorithm>
#include <cmath>

#include <opencv2/imgproc.hpp>

#include "vora/Images.h"

namespace vora {
namespace cli {
namespace {

constexpr int kCell = 420;      // thumbnails fit a kCell x kCell square
constexpr int kGap = 16;
constexpr int kLabelHeight = 48;
constexpr int kHeadingHeight = 44;
const cv::Scalar kBackground(34, 34, 34);
const cv::Scalar kText(235, 235, 235);
const cv::Scalar kDimText(170, 170, 170);
const cv::Scalar kFaceColour(255, 214, 0);  // R, G, B: amber, visible on skin and sky alike

void Text(cv::Mat& sheet, const std::string& text, cv::Point origin, double scale, const cv::Scalar& colour,
          int thickness) {
    cv::putText(sheet, text, origin, cv::FONT_HERSHEY_SIMPLEX, scale, colour, thickness, cv::LINE_AA);
}

}  // namespace

cv::Mat MakeThumbnail(const cv::Mat& rgbOrRgba, int maxSide) {
    cv::Mat rgb;
    if (rgbOrRgba.channels() == 4)
        cv::cvtColor(rgbOrRgba, rgb, cv::COLOR_RGBA2RGB);
    else
        rgb = rgbOrRgba;
    return ScaledToLongSide(rgb, maxSide).clone();  // its own pixels, whatever the caller does next
}

cv::Mat ComposeContactSheet(const std::string& heading, const std::vector<SheetEntry>& entries,
                            const std::vector<CFaceRect>& faces) {
    const int count = static_cast<int>(entries.size());
    const int columns = count <= 3 ? std::max(1, count) : (count == 4 ? 2 : (count <= 9 ? 3 : 4));
    const int rows = (count + columns - 1) / columns;
    // Cells are as tall as the tallest thumbnail, so wide photos leave no
    // empty bands.
    int thumbHeight = 1;
    for (const SheetEntry& e : entries) thumbHeight = std::max(thumbHeight, e.thumbnail.rows);
    const int cellW = kCell, cellH = thumbHeight + kLabelHeight;
    const int width = kGap + columns * (cellW + kGap);
    const int height = kHeadingHeight + rows * (cellH + kGap) + kGap;
    cv::Mat sheet(height, width, CV_8UC3, kBackground);
    Text(sheet, heading, cv::Point(kGap, 30), 0.7, kText, 1);

    for (int i = 0; i < count; ++i) {
        const SheetEntry& e = entries[static_cast<size_t>(i)];
        const int x0 = kGap + (i % columns) * (cellW + kGap);
        const int y0 = kHeadingHeight + (i / columns) * (cellH + kGap);
        const int tx = x0 + (cellW - e.thumbnail.cols) / 2;
        const int ty = y0 + (thumbHeight - e.thumbnail.rows) / 2;
        e.thumbnail.copyTo(sheet(cv::Rect(tx, ty, e.thumbnail.cols, e.thumbnail.rows)));
        for (const CFaceRect& f : faces) {
            const cv::Point a(tx + static_cast<int>(std::lround(f.left * e.thumbnail.cols)),
                              ty + static_cast<int>(std::lround(f.top * e.thumbnail.rows)));
            const cv::Point b(tx + static_cast<int>(std::lround(f.right * e.thumbnail.cols)) - 1,
                              ty + static_cast<int>(std::lround(f.bottom * e.thumbnail.rows)) - 1);
            cv::rectangle(sheet, a, b, kFaceColour, 2, cv::LINE_AA);
        }
        Text(sheet, e.title, cv::Point(x0, y0 + thumbHeight + 22), 0.65, kText, 2);
        Text(sheet, e.detail, cv::Point(x0, y0 + thumbHeight + 42), 0.5, kDimText, 1);
    }
    return sheet;
}

}  // namespace cli
}  // namespace vora
