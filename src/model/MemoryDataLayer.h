#pragma once

// The MemoryData first layer, which the dnn module cannot run: the library
// applies its transform itself and hands the module a plain input.

#include <vector>

#include "model/PreparedDefinition.h"
#include "model/ProtoText.h"

namespace vora {
namespace netdef {

bool IsMemoryData(const prototext::Message& layer);

// Fills prepared's transform, input name and MemoryData flag from the layer
// and returns the `input` / `input_shape` fields that replace it (the label
// top is dropped). Refuses missing sizes, a crop larger than the input, a
// mean_value count that is neither one nor the channel count, and mean_file
// with mean_value.
std::vector<prototext::Field> ReplaceMemoryData(const prototext::Message& layer, PreparedDefinition& prepared);

}  // namespace netdef
}  // namespace vora
