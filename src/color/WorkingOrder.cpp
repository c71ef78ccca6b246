#include "color/WorkingOrder.h"

#include <opencv2/imgproc.hpp>

namespace vora {

cv::Mat RgbView(const IImage* image) {
    return cv::Mat(static_cast<int>(image->GetHeight()), static_cast<int>(image->GetWidth()), CV_8UC3,
                   const_cast<uint8_t*>(image->GetConstData()));
}

cv::Mat ToWorkingOrder(const IImage* image) {
    cv::Mat bgr;
    cv::cvtColor(RgbView(image), bgr, cv::COLOR_RGB2BGR);
    return bgr;
}

}  // namespace vora
