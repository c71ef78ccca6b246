#include "model/InputTransform.h"

#include <cstdint>

namespace vora {

cv::Mat ApplyInputTransform(const InputTransform& transform, const cv::Mat& image8) {
    CV_CheckDepthEQ(image8.depth(), CV_8U, "the network input must be 8-bit");
    CV_CheckEQ(image8.channels(), transform.channels, "the network input has the wrong channel count");
    const int channels = transform.channels;
    int outRows = image8.rows;
    int outCols = image8.cols;
    int top = 0;
    int left = 0;
    if (transform.cropSize > 0) {
        CV_CheckGE(image8.rows, transform.cropSize, "the network input is smaller than the crop");
        CV_CheckGE(image8.cols, transform.cropSize, "the network input is smaller than the crop");
        outRows = outCols = transform.cropSize;
        top = (image8.rows - transform.cropSize) / 2;
        left = (image8.cols - transform.cropSize) / 2;
    } else if (transform.height > 0 && transform.width > 0) {
        CV_CheckEQ(image8.rows, transform.height, "the network input has the wrong height");
        CV_CheckEQ(image8.cols, transform.width, "the network input has the wrong width");
    }
    const bool meanBlob = !transform.meanBlob.empty();
    if (meanBlob) {
        CV_CheckEQ(transform.meanBlob.dims, 3, "the mean blob must be channels x height x width");
        CV_CheckTypeEQ(transform.meanBlob.type(), CV_32F, "the mean blob must be float");
        CV_CheckEQ(transform.meanBlob.size[0], channels, "the mean blob has the wrong channel count");
        CV_CheckEQ(transform.meanBlob.size[1], image8.rows, "the mean blob and the input differ in height");
        CV_CheckEQ(transform.meanBlob.size[2], image8.cols, "the mean blob and the input differ in width");
    }
    const size_t means = transform.meanValues.size();
    CV_Check(means, means <= 1 || means == static_cast<size_t>(channels), "one mean value, or one per channel");

    const int shape[4] = {1, channels, outRows, outCols};
    cv::Mat blob(4, shape, CV_32F);
    float* out = blob.ptr<float>();
    for (int c = 0; c < channels; ++c) {
        const float meanValue = means == 0 ? 0.0f : transform.meanValues[means == 1 ? 0 : static_cast<size_t>(c)];
        for (int y = 0; y < outRows; ++y) {
            const uint8_t* in = image8.ptr<uint8_t>(top + y) + static_cast<size_t>(left) * channels + c;
            const float* meanRow = meanBlob ? transform.meanBlob.ptr<float>(c, top + y) + left : nullptr;
            for (int x = 0; x < outCols; ++x, in += channels) {
                const float mean = meanBlob ? meanRow[x] : meanValue;
                *out++ = (static_cast<float>(*in) - mean) * transform.scale;
            }
        }
    }
    return blob;
}

}  // namespace vora
