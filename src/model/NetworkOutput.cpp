#include "model/NetworkOutput.h"

#include <map>
#include <set>
#include <string>

#include "model/DefinitionNumbers.h"
#include "model/PhaseFilter.h"

namespace vora {
namespace netdef {

using prototext::Field;
using prototext::Message;

// The blobs left unconsumed once every layer has run, as the original network
// library collects its outputs: an ordered set, so several come out by name.
void FindOutput(const Message& net, PreparedDefinition& prepared) {
    std::set<std::string> available;
    for (const std::string& input : net.Scalars("input")) available.insert(input);

    struct Writer {
        std::string layer;
        int index;
    };
    std::map<std::string, Writer> lastWriter;
    std::map<std::string, int> nameCount;
    for (const Field& field : net.fields) {
        if (!IsLayerField(field)) continue;
        const Message& layer = field.message;
        // The dnn importer renames repeated layer names to name_1, name_2, ...
        std::string name = layer.Scalar("name");
        const int repeats = nameCount[name]++;
        if (repeats > 0) name += "_" + std::to_string(repeats);

        for (const std::string& bottom : layer.Scalars("bottom")) available.erase(bottom);
        const std::vector<std::string> tops = layer.Scalars("top");
        for (size_t i = 0; i < tops.size(); ++i) {
            available.insert(tops[i]);
            // An in-place layer (top == bottom) keeps the blob's name; the
            // dnn module then reads it from the last layer that wrote it.
            lastWriter[tops[i]] = Writer{name, static_cast<int>(i)};
        }
    }
    if (available.empty()) Refuse("no output: every blob is consumed by some layer");
    prepared.outputTop = *available.begin();
    const auto writer = lastWriter.find(prepared.outputTop);
    if (writer == lastWriter.end()) Refuse("the output '" + prepared.outputTop + "' is not written by any layer");
    prepared.outputLayer = writer->second.layer;
    prepared.outputIndex = writer->second.index;
}

}  // namespace netdef
}  // namespace vora
