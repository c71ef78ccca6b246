#include "semantic/NetworkInput.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <iostream>
#include <vector>

#include <opencv2/imgproc.hpp>

#include "model/FeatureNetwork.h"

namespace vora {

namespace {
const char* const kEmptyImageMessage = "Could not open or find the image";
constexpr int kFeatureLength = 512;
}  // namespace

cv::Rect AspectCropRegion(int rows, int cols) {
    cv::Rect region(0, 0, cols, rows);
    if (rows == cols) return region;
    const int longSide = std::max(rows, cols);
    const int shortSide = std::min(rows, cols);
    const double ratio = static_cast<double>(longSide) / shortSide;
    if (ratio < kMaxAspectRatio) return region;
    // One pixel short of 1.5 times the short side, and an even excess, so a
    // 1000 x 1500 image keeps 1499 columns from x = 0.
    const int keep = std::max(static_cast<int>(std::trunc(shortSide * kMaxAspectRatio - 1.0)), 1);
    int excess = longSide - keep;
    if (excess % 2 != 0) excess -= 1;
    const int offset = excess / 2;
    if (rows < cols) return cv::Rect(offset, 0, keep, shortSide);
    return cv::Rect(0, offset, shortSide, keep);
}

bool PrepareNetworkImage(const cv::Mat& image, cv::Mat& output, int cropSize, int inputSize) {
    if (image.empty()) {
        std::cerr << kEmptyImageMessage << std::endl;
        return false;
    }
    const cv::Mat region = image(AspectCropRegion(image.rows, image.cols));
    if (cropSize < inputSize) {
        // The border is 14 pixels at top and left and 15 at bottom and right
        // for 227 in 256; the network's centre crop removes it again.
        output = cv::Mat::zeros(inputSize, inputSize, image.type());
        const int offset = (inputSize - cropSize) / 2;
        cv::Mat area = output(cv::Rect(offset, offset, cropSize, cropSize));
        cv::resize(region, area, area.size(), 0, 0, cv::INTER_AREA);
    } else {
        cv::resize(region, output, cv::Size(cropSize, cropSize), 0, 0, cv::INTER_AREA);
    }
    return true;
}

bool ExtractFeature(FeatureNetwork& network, const cv::Mat& pixels8, float* feature, ChannelOrder order) {
    cv::Mat input;
    if (!PrepareNetworkImage(pixels8, input, kNetworkImageSize, kNetworkInputSize)) return false;
    if (order == ChannelOrder::Rgb) cv::cvtColor(input, input, cv::COLOR_RGB2BGR);
    const std::vector<float> output = network.Forward(input);
    // A network with a shorter output cannot give a feature; nothing is written.
    if (output.size() < static_cast<size_t>(kFeatureLength)) return false;
    std::memcpy(feature, output.data(), kFeatureLength * sizeof(float));
    return true;
}

}  // namespace vora
