#pragma once

#include <memory>
#include <string>
#include <vector>

#include <opencv2/core.hpp>
#include <opencv2/dnn.hpp>

namespace vora {

extern const char* const kNetworkFolder;          // "net/"
extern const char* const kNetworkDefinitionName;  // "deploy2.prototxt"
extern const char* const kNetworkWeightsName;     // "caffe_reduce_512_model"

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
cv::Mat ApplyInputTransform(const InputTransform& transform, const cv::Mat& image8);

// The semantic feature network, run with OpenCV's dnn module on the CPU.
class FeatureNetwork {
public:
    // Reads the text definition and binary weights. A MemoryData first layer
    // is replaced by a plain input of the transformed size. Throws
    // cv::Exception when a file is missing or unreadable.
    static std::unique_ptr<FeatureNetwork> Load(const std::string& definitionPath,
                                                const std::string& weightsPath);

    // One forward pass on an 8-bit image of the data layer's size; returns the
    // output top (the one no layer consumes; the first by name if several),
    // flattened to floats. Writes the network's buffers: not reentrant.
    std::vector<float> Forward(const cv::Mat& image8);

    const InputTransform& transform() const { return m_transform; }
    bool hasMemoryDataInput() const { return m_memoryData; }
    const std::string& outputName() const { return m_outputName; }

private:
    cv::dnn::Net m_net;
    InputTransform m_transform;
    bool m_memoryData = false;
    std::string m_inputName;
    std::string m_outputName;
};

}  // namespace vora
