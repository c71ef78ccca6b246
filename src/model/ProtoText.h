#pragma once

// A small reader and writer of the protobuf text format, enough to edit a
// network definition as a tree: comments, nested blocks (`{}` or `<>`, with or
// without a colon), quoted strings with escapes and adjacent-literal
// concatenation, repeated fields and the `[a, b]` list shorthand. Field names
// are kept as written; nothing is checked against a schema.

#include <cstdint>
#include <string>
#include <vector>

namespace vora {
namespace prototext {

struct Field;

// The fields of one message, in file order (repeated fields appear once per value).
struct Message {
    std::vector<Field> fields;

    const Field* First(const std::string& name) const;
    std::vector<const Field*> All(const std::string& name) const;
    // The first scalar of that name, or fallback when there is none.
    std::string Scalar(const std::string& name, const std::string& fallback = std::string()) const;
    // Every scalar of that name, in order.
    std::vector<std::string> Scalars(const std::string& name) const;
};

struct Field {
    std::string name;
    bool isMessage = false;
    // Scalars: the decoded contents of a string literal, or the token as
    // written (numbers, enum names, true/false).
    std::string value;
    bool quoted = false;
    Message message;  // isMessage only

    static Field MakeScalar(std::string name, std::string value, bool quoted);
    static Field MakeMessage(std::string name, Message message);
};

// Blocks nest at most this deep; deeper text is refused as a parse error.
constexpr int kMaxNesting = 100;

// Throws cv::Exception (StsParseError) with the line and column of the fault.
Message Parse(const std::string& text);

// Writes the tree back as text that Parse (and any text-format reader) accepts.
std::string Write(const Message& message);

}  // namespace prototext
}  // namespace vora
