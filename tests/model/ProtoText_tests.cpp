#include <gtest/gtest.h>

#include <opencv2/core.hpp>

#include "model/ProtoText.h"

namespace vora {
namespace {

namespace pt = prototext;

// The whole tree on one line: name:value (quoted values in quotes), blocks in braces.
std::string Flat(const pt::Message& message) {
    std::string text;
    for (const pt::Field& f : message.fields)
        text += " " + f.name +
                (f.isMessage ? " {" + Flat(f.message) + " }" : f.quoted ? ":\"" + f.value + "\"" : ":" + f.value);
    return text;
}

// The message of the parse error the text raises; empty when it parses or fails otherwise.
std::string ParseError(const std::string& text) {
    try {
        pt::Parse(text);
    } catch (const cv::Exception& e) {
        if (e.code == cv::Error::StsParseError) return e.err;
    }
    return "";
}

TEST(ProtoText, ReadsCommentsNestedBlocksAndListShorthand) {
    const pt::Message net = pt::Parse(R"(# leading comment
name: "net"  # trailing comment
layer {
  name: "data"   # layer { type: "Fake" }
  input_param { shape: { dim: 1 dim: 3 } }
}
layer <
  name: 'pool'; bottom: "data",
  pooling_param { pool: AVE kernel_size: -1.5e-3 mean_value: [104, 117.5] shape: [{dim: 1}, {dim: 2}] empty: [] }
>
)");
    const std::string flat = R"( name:"net" layer { name:"data" input_param { shape { dim:1 dim:3 } } } layer {)"
                             R"( name:"pool" bottom:"data" pooling_param { pool:AVE kernel_size:-1.5e-3)"
                             R"( mean_value:104 mean_value:117.5 shape { dim:1 } shape { dim:2 } } })";
    EXPECT_EQ(Flat(net), flat);
    EXPECT_EQ(Flat(pt::Parse(pt::Write(net))), flat);  // and back
}

TEST(ProtoText, DecodesStringEscapesJoinsLiteralsAndWritesThemBack) {
    const pt::Message message = pt::Parse(
        R"(a: "quote \" hash # brace { tab\t nl\n oct\101 hex\x42\x01 uni\u00e9 back\\" b: 'it''s' "!")");
    const std::string flat = " a:\"quote \" hash # brace { tab\t nl\n octA hexB\x01 uni\xc3\xa9 back\\\" b:\"its!\"";
    EXPECT_EQ(Flat(message), flat);
    EXPECT_EQ(Flat(pt::Parse(pt::Write(message))), flat);
}

TEST(ProtoText, ReportsWhereTheTextIsMalformed) {
    for (const char* text : {
             "layer { name: \"x\"",       // unclosed block
             "name: \"unterminated\n\"",  // string across a line
             "layer { } }",               // stray brace
             "a: \"\\q\"",                // unknown escape
         })
        EXPECT_NE(ParseError(text).find("line "), std::string::npos) << text;
}

// Nesting is limited so a small hostile file cannot exhaust the stack: the
// limit itself is read, one level more is refused, and 20,000 levels (which
// overflowed the stack) are refused with the line and column.
TEST(ProtoText, RefusesNestingBeyondTheLimit) {
    const auto nested = [](int levels, const char* open, const char* close) {
        std::string text;
        for (int i = 0; i < levels; ++i) text += std::string("a ") + open;
        text += " v: 1 ";
        for (int i = 0; i < levels; ++i) text += close;
        return text;
    };
    pt::Message deepest = pt::Parse(nested(pt::kMaxNesting, "{", "}"));
    for (int i = 0; i < pt::kMaxNesting; ++i) deepest = pt::Message(deepest.fields.at(0).message);
    EXPECT_EQ(Flat(deepest), " v:1");
    for (const int levels : {pt::kMaxNesting + 1, 20000}) {
        const std::string error = ParseError(nested(levels, "<", ">"));
        EXPECT_NE(error.find("nested deeper than 100 levels"), std::string::npos) << levels << ": " << error;
        EXPECT_NE(error.find("column 303"), std::string::npos) << levels << ": " << error;
    }
}

}  // namespace
}  // namespace vora
