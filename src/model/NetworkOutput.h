#pragma once

#include "model/PreparedDefinition.h"
#include "model/ProtoText.h"

namespace vora {
namespace netdef {

// Sets prepared's output top, layer and index: the blobs no layer consumes,
// the first by name if several, written last by which layer.
void FindOutput(const prototext::Message& net, PreparedDefinition& prepared);

}  // namespace netdef
}  // namespace vora
