#pragma once

// Numbers and required sizes in a network's text definition, read as the
// format writes them (independent of the C locale); faults are refused with
// cv::Exception naming the field.

#include <cstdint>
#include <string>

#include "model/ProtoText.h"

namespace vora {
namespace netdef {

[[noreturn]] void Refuse(const std::string& what);  // "network definition: " + what

int64_t ParseInteger(const std::string& token, const std::string& field);
float ParseFloat(const std::string& token, const std::string& field);  // read as double, then narrowed
// message.name as an int in 1..INT_MAX; context names the message in errors.
int PositiveInt(const prototext::Message& message, const std::string& name, const std::string& context);

}  // namespace netdef
}  // namespace vora
