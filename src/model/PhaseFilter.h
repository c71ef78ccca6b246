#pragma once

// Which layers of a text definition a network built for testing keeps.

#include "model/ProtoText.h"

namespace vora {
namespace netdef {

// A `layer` (or old-format `layers`) entry of the net.
bool IsLayerField(const prototext::Field& field);

// The layer's include/exclude rules against the state of a network built for
// testing: phase TEST, level 0, no stages.
bool KeptInTestPhase(const prototext::Message& layer);

}  // namespace netdef
}  // namespace vora
