#include "model/DefinitionNumbers.h"

#include <cctype>
#include <cerrno>
#include <cstdlib>
#include <limits>
#include <locale>
#include <sstream>

#include <opencv2/core.hpp>

namespace vora {
namespace netdef {

using prototext::Field;
using prototext::Message;

[[noreturn]] void Refuse(const std::string& what) {
    CV_Error(cv::Error::StsBadArg, "network definition: " + what);
}

// Numbers as the text format writes them, independent of the C locale.
int64_t ParseInteger(const std::string& token, const std::string& field) {
    if (token.empty()) Refuse("empty value for " + field);
    errno = 0;
    char* end = nullptr;
    const long long value = std::strtoll(token.c_str(), &end, 0);
    if (errno != 0 || end != token.c_str() + token.size()) Refuse("'" + token + "' is not an integer (" + field + ")");
    return value;
}

float ParseFloat(const std::string& token, const std::string& field) {
    std::string text = token;
    if (text.size() > 1 && (text.back() == 'f' || text.back() == 'F') && text.find_first_of("xX") == std::string::npos)
        text.pop_back();
    std::string lower;
    for (char c : text) lower.push_back(static_cast<char>(std::tolower(static_cast<unsigned char>(c))));
    const bool negative = !lower.empty() && lower[0] == '-';
    const std::string bare = negative ? lower.substr(1) : lower;
    if (bare == "inf" || bare == "infinity")
        return negative ? -std::numeric_limits<float>::infinity() : std::numeric_limits<float>::infinity();
    if (bare == "nan") return std::numeric_limits<float>::quiet_NaN();
    std::istringstream in(text);
    in.imbue(std::locale::classic());
    double value = 0.0;
    in >> value;
    if (in.fail() || !in.eof()) Refuse("'" + token + "' is not a number (" + field + ")");
    // Read as double, then narrowed, as the format's own reader does.
    return static_cast<float>(value);
}

int PositiveInt(const Message& message, const std::string& name, const std::string& context) {
    const Field* field = message.First(name);
    if (field == nullptr || field->isMessage) Refuse(context + "." + name + " is missing");
    const int64_t value = ParseInteger(field->value, context + "." + name);
    if (value <= 0 || value > std::numeric_limits<int>::max())
        Refuse(context + "." + name + " must be positive, is " + field->value);
    return static_cast<int>(value);
}

}  // namespace netdef
}  // namespace vora
