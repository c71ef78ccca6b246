#include "model/PhaseFilter.h"

#include "model/DefinitionNumbers.h"

namespace vora {
namespace netdef {

using prototext::Field;
using prototext::Message;

namespace {

// A NetStateRule against the state a network built for testing has: phase
// TEST, level 0, no stages.
bool RuleMatchesTestState(const Message& rule) {
    const Field* phase = rule.First("phase");
    if (phase != nullptr && phase->value != "TEST" && phase->value != "1") return false;
    const Field* minLevel = rule.First("min_level");
    if (minLevel != nullptr && ParseInteger(minLevel->value, "min_level") > 0) return false;
    const Field* maxLevel = rule.First("max_level");
    if (maxLevel != nullptr && ParseInteger(maxLevel->value, "max_level") < 0) return false;
    if (rule.First("stage") != nullptr) return false;  // no stage is set
    return true;
}

}  // namespace

bool KeptInTestPhase(const Message& layer) {
    const std::vector<const Field*> includes = layer.All("include");
    if (!includes.empty()) {
        bool included = false;
        for (const Field* rule : includes) included = included || RuleMatchesTestState(rule->message);
        if (!included) return false;
    }
    for (const Field* rule : layer.All("exclude"))
        if (RuleMatchesTestState(rule->message)) return false;
    return true;
}

bool IsLayerField(const Field& field) {
    return field.isMessage && (field.name == "layer" || field.name == "layers");
}

}  // namespace netdef
}  // namespace vora
