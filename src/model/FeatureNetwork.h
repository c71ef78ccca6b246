#pragma once

#include <memory>
#include <string>
#include <vector>

#include <opencv2/core.hpp>
#include <opencv2/dnn.hpp>

#include "model/InputTransform.h"
#include "model/MeanBlob.h"
#include "model/ModelFileNames.h"
#include "model/PreparedDefinition.h"

#include "KitApi.h"

namespace vora {

// Parses the definition, drops the layers a network built for testing leaves
// out (include/exclude rules against phase TEST, level 0, no stages), replaces
// a MemoryData first layer by `input` / `input_shape` fields (its label top is
// dropped) and finds the output. Throws cv::Exception on a parse error or a
// MemoryData layer it cannot honour (missing sizes, a crop larger than the
// input, a mean_value count that is neither one nor the channel count,
// mean_file and mean_value together).
PreparedDefinition PrepareDefinition(const std::string& definitionText);

// The semantic feature network, run with OpenCV's dnn module on the CPU.
class VORA_KIT_API FeatureNetwork {
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
