#pragma once

#include <vector>

#include <opencv2/core.hpp>

namespace vora {

// The input transform of a MemoryData first layer, which the dnn module
// cannot run: the library applies it before the forward pass.
struct InputTransform {
    int channels = 3;
    int height = 0;        // uncropped input size, from memory_data_param
    int width = 0;
    int cropSize = 0;      // 0: no crop
    float scale = 1.0f;
    std::vector<float> meanValues;  // empty, one for every channel, or one per channel
    cv::Mat meanBlob;               // CV_32F, channels x height x width, from mean_file; empty if none

    int OutputHeight() const { return cropSize > 0 ? cropSize : height; }
    int OutputWidth() const { return cropSize > 0 ? cropSize : width; }
};

// Planar 1 x C x h x w float blob: centre crop at ((H - crop) / 2, (W - crop) / 2),
// then (pixel - mean) x scale in float, channels in the matrix's own order.
// The image must be 8-bit with the transform's channel count; with a crop it
// must be at least the crop size, without one exactly height x width (when
// those are set), and with a mean blob exactly the blob's size. Throws
// cv::Exception otherwise.
cv::Mat ApplyInputTransform(const InputTransform& transform, const cv::Mat& image8);

}  // namespace vora
