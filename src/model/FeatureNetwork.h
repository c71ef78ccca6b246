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
// The image must be 8-bit with the transform's channel count; with a crop it
// must be at least the crop size, without one exactly height x width (when
// those are set), and with a mean blob exactly the blob's size. Throws
// cv::Exception otherwise.
cv::Mat ApplyInputTransform(const InputTransform& transform, const cv::Mat& image8);

// What the loader makes of a text definition before the dnn module sees it.
struct PreparedDefinition {
    std::string text;          // the definition as handed to the dnn module
    bool memoryData = false;   // the first layer was a MemoryData layer, now a plain input
    InputTransform transform;  // its transform (meanBlob not loaded here)
    std::string meanFile;      // its mean_file as written, or empty
    std::string inputName;     // the input blob to set; empty: the network's first input
    std::string outputTop;     // the top no layer consumes; the first by name if several
    std::string outputLayer;   // the dnn layer that writes it last
    int outputIndex = 0;       // which of that layer's outputs it is
};

// Parses the definition, drops the layers a network built for testing leaves
// out (include/exclude rules against phase TEST, level 0, no stages), replaces
// a MemoryData first layer by `input` / `input_shape` fields (its label top is
// dropped) and finds the output. Throws cv::Exception on a parse error or a
// MemoryData layer it cannot honour (missing sizes, a crop larger than the
// input, a mean_value count that is neither one nor the channel count,
// mean_file and mean_value together).
PreparedDefinition PrepareDefinition(const std::string& definitionText);

// Reads a mean blob file (the weights format's BlobProto: `shape` or the
// num/channels/height/width fields, data as float or double) and returns its
// first image as a channels x height x width CV_32F matrix. Throws
// cv::Exception when the file cannot be read or does not hold that shape.
cv::Mat ReadMeanBlob(const std::string& path, int channels, int height, int width);

// The semantic feature network, run with OpenCV's dnn module on the CPU.
class FeatureNetwork {
public:
    // Reads the text definition and binary weights. A MemoryData first layer
    // is replaced by a plain input of the transformed size; its mean_file, if
    // any, is read relative to the definition's folder (absolute paths as
    // given). Throws cv::Exception when a file is missing or unreadable (the
    // dnn module's own for the two network files).
    static std::unique_ptr<FeatureNetwork> Load(const std::string& definitionPath,
                                                const std::string& weightsPath);

    // One forward pass; returns the output top flattened to floats. With a
    // MemoryData input the image (8-bit, the data layer's size) goes through
    // its transform; otherwise it is fed as it is, as a planar float blob of
    // its own size with no mean or scale. Writes the network's buffers: not
    // reentrant.
    std::vector<float> Forward(const cv::Mat& image8);

    const InputTransform& transform() const { return m_transform; }
    bool hasMemoryDataInput() const { return m_memoryData; }
    const std::string& outputName() const { return m_outputName; }    // the output top
    const std::string& outputLayer() const { return m_outputLayer; }  // the dnn layer read for it

private:
    cv::dnn::Net m_net;
    InputTransform m_transform;
    bool m_memoryData = false;
    std::string m_inputName;
    std::string m_outputName;
    std::string m_outputLayer;
    int m_outputIndex = 0;
};

}  // namespace vora
