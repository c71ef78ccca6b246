// The network definition: the text-format reader, then the preparation that
// interprets the tree (layer filtering, the data layer's transform). A parse
// or definition error is cv::Exception; anything else is a finding.
#include <cstddef>
#include <cstdint>
#include <string>

#include <opencv2/core.hpp>

#include "model/FeatureNetwork.h"
#include "model/ProtoText.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const std::string text(reinterpret_cast<const char*>(data), size);
    try {
        const vora::prototext::Message message = vora::prototext::Parse(text);
        // What the writer gives back must read again as the same text.
        const std::string written = vora::prototext::Write(message);
        if (vora::prototext::Write(vora::prototext::Parse(written)) != written) __builtin_trap();
        (void)vora::PrepareDefinition(text);
    } catch (const cv::Exception&) {
    }
    return 0;
}
