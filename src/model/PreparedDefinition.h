#pragma once

#include <string>

#include "model/InputTransform.h"

namespace vora {

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

}  // namespace vora
