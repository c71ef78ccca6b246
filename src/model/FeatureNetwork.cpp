#include "model/FeatureNetwork.h"

#include <string>

#include "model/DefinitionNumbers.h"
#include "model/MemoryDataLayer.h"
#include "model/NetworkOutput.h"
#include "model/PhaseFilter.h"
#include "model/ProtoText.h"

namespace vora {

namespace {

using prototext::Field;
using prototext::Message;

std::string Dirname(const std::string& path) {
    const size_t slash = path.find_last_of('/');
    return slash == std::string::npos ? std::string() : path.substr(0, slash + 1);
}

}  // namespace

PreparedDefinition PrepareDefinition(const std::string& definitionText) {
    const Message original = prototext::Parse(definitionText);
    PreparedDefinition prepared;
    Message net;
    bool firstLayer = true;
    for (const Field& field : original.fields) {
        if (!netdef::IsLayerField(field)) {
            net.fields.push_back(field);
            continue;
        }
        // Layers a network built for testing leaves out are dropped here, so
        // that neither the first-layer test nor the dnn module sees them.
        if (!netdef::KeptInTestPhase(field.message)) continue;
        if (firstLayer && netdef::IsMemoryData(field.message)) {
            for (Field& replacement : netdef::ReplaceMemoryData(field.message, prepared)) net.fields.push_back(replacement);
        } else {
            net.fields.push_back(field);
        }
        firstLayer = false;
    }

    if (!prepared.memoryData) {
        const std::vector<std::string> inputs = net.Scalars("input");
        if (!inputs.empty()) {
            prepared.inputName = inputs[0];
        } else {
            for (const Field& field : net.fields) {
                if (netdef::IsLayerField(field) && field.message.Scalar("type") == "Input") {
                    prepared.inputName = field.message.Scalar("top");
                    break;
                }
            }
        }
    }
    netdef::FindOutput(net, prepared);
    prepared.text = prototext::Write(net);
    return prepared;
}

std::unique_ptr<FeatureNetwork> FeatureNetwork::Load(const std::string& definitionPath,
                                                     const std::string& weightsPath) {
    std::string definition;
    std::string weights;
    if (!ReadWholeFile(definitionPath, definition) || !ReadWholeFile(weightsPath, weights)) {
        // Let the dnn module report the missing file in its own words.
        cv::dnn::readNetFromCaffe(definitionPath, weightsPath);
        CV_Error(cv::Error::StsError, "cannot read the network files " + definitionPath + " and " + weightsPath);
    }

    // The dnn module reads an empty weights buffer as "no weights" and builds a
    // network that fails only when run; refuse it here, where the model loads.
    if (weights.empty()) CV_Error(cv::Error::StsError, "the network weights file " + weightsPath + " is empty");

    const PreparedDefinition prepared = PrepareDefinition(definition);
    std::unique_ptr<FeatureNetwork> network(new FeatureNetwork());
    network->m_transform = prepared.transform;
    network->m_memoryData = prepared.memoryData;
    network->m_inputName = prepared.inputName;
    network->m_outputName = prepared.outputTop;
    network->m_outputLayer = prepared.outputLayer;
    network->m_outputIndex = prepared.outputIndex;
    if (!prepared.meanFile.empty()) {
        const std::string meanPath =
            prepared.meanFile[0] == '/' ? prepared.meanFile : Dirname(definitionPath) + prepared.meanFile;
        network->m_transform.meanBlob =
            ReadMeanBlob(meanPath, prepared.transform.channels, prepared.transform.height, prepared.transform.width);
    }

    network->m_net = cv::dnn::readNetFromCaffe(prepared.text.data(), prepared.text.size(), weights.data(), weights.size());
    network->m_net.setPreferableBackend(cv::dnn::DNN_BACKEND_OPENCV);
    network->m_net.setPreferableTarget(cv::dnn::DNN_TARGET_CPU);
    if (network->m_net.getLayerId(prepared.outputLayer) < 0)
        CV_Error(cv::Error::StsError, "the network has no layer '" + prepared.outputLayer + "' for its output '" +
                                          prepared.outputTop + "'");
    return network;
}

std::vector<float> FeatureNetwork::Forward(const cv::Mat& image8) {
    cv::Mat blob;
    if (m_memoryData) {
        blob = ApplyInputTransform(m_transform, image8);
    } else {
        InputTransform plain;
        plain.channels = image8.channels();
        blob = ApplyInputTransform(plain, image8);
    }
    m_net.setInput(blob, m_inputName);
    std::vector<cv::Mat> outputs;
    m_net.forward(outputs, m_outputLayer);
    CV_CheckLT(m_outputIndex, static_cast<int>(outputs.size()), "the output layer gave too few outputs");
    cv::Mat output = outputs[static_cast<size_t>(m_outputIndex)];
    CV_CheckTypeEQ(output.type(), CV_32F, "the network output must be float");
    if (!output.isContinuous()) output = output.clone();
    const float* values = output.ptr<float>();
    return std::vector<float>(values, values + output.total());
}

}  // namespace vora
