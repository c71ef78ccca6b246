#include "color/WorkingOrder.h"

#include <opencv2/imgproc.hpp>

namespace vora {

cv::Mat ToWorkingOrder(const IImage* image) {
    const cv::Mat rgb(static_cast<int>(image->GetHeight()), static_cast<int>(image->GetWidth()), CV_8UC3,
                      const_cast<uint8_t*>(image->GetConstData()));
    cv::Mat bgr;
    cv::cvtColor(rgb, bgr, cv::COLOR_RGB2BGR);
    return bgr;
}

}  // namespace vora
