#include <gtest/gtest.h>

#include <opencv2/core.hpp>

#include "model/ProtoText.h"

namespace vora {
namespace {

namespace pt = prototext;

TEST(ProtoText, ReadsCommentsNestedBlocksAndRepeatedFields) {
    const pt::Message net = pt::Parse(R"(# leading comment
name: "net"  # trailing comment
layer {
  name: "data"   # layer { type: "Fake" }
  type: "Input"
  top: "data"
  input_param { shape: { dim: 1 dim: 3 } }
}
layer <
  name: 'pool'; type: "Pooling", bottom: "data" top: "pool"
  pooling_param { pool: AVE global_pooling: true kernel_size: -1.5e-3 }
>
)");
    ASSERT_EQ(net.fields.size(), 3u);
    EXPECT_EQ(net.Scalar("name"), "net");
    const std::vector<const pt::Field*> layers = net.All("layer");
    ASSERT_EQ(layers.size(), 2u);
    EXPECT_EQ(layers[0]->message.Scalar("type"), "Input");
    const pt::Field* shape = layers[0]->message.First("input_param")->message.First("shape");
    ASSERT_NE(shape, nullptr);
    EXPECT_EQ(shape->message.Scalars("dim"), (std::vector<std::string>{"1", "3"}));

    const pt::Message& pool = layers[1]->message;
    EXPECT_EQ(pool.Scalar("name"), "pool");
    EXPECT_EQ(pool.Scalar("bottom"), "data");
    const pt::Message& params = pool.First("pooling_param")->message;
    EXPECT_EQ(params.Scalar("pool"), "AVE");
    EXPECT_FALSE(params.First("pool")->quoted);
    EXPECT_EQ(params.Scalar("kernel_size"), "-1.5e-3");
    EXPECT_EQ(params.Scalar("missing", "fallback"), "fallback");
}

TEST(ProtoText, DecodesStringEscapesAndJoinsAdjacentLiterals) {
    const pt::Message message = pt::Parse(
        R"(a: "quote \" hash # brace { tab\t nl\n oct\101 hex\x42 uni\u00e9 back\\" b: 'it''s' "!")");
    EXPECT_EQ(message.Scalar("a"), "quote \" hash # brace { tab\t nl\n octA hexB uni\xc3\xa9 back\\");
    EXPECT_TRUE(message.First("a")->quoted);
    EXPECT_EQ(message.Scalar("b"), "its!");
}

TEST(ProtoText, ExpandsListShorthand) {
    const pt::Message message = pt::Parse("mean_value: [104, 117.5, 123] shape: [{dim: 1}, {dim: 2}] empty: []");
    EXPECT_EQ(message.Scalars("mean_value"), (std::vector<std::string>{"104", "117.5", "123"}));
    ASSERT_EQ(message.All("shape").size(), 2u);
    EXPECT_EQ(message.All("shape")[1]->message.Scalar("dim"), "2");
    EXPECT_EQ(message.First("empty"), nullptr);
}

TEST(ProtoText, WrittenTextReadsBackToTheSameTree) {
    const std::string text = R"(name: "a\"b\\c\n\x01"
layer { name: "x" top: "y" param { lr_mult: 0 } include { phase: TEST } }
input: "data"
)";
    const pt::Message first = pt::Parse(text);
    const std::string written = pt::Write(first);
    const pt::Message second = pt::Parse(written);
    EXPECT_EQ(pt::Write(second), written);
    EXPECT_EQ(second.Scalar("name"), "a\"b\\c\n\x01");
    EXPECT_EQ(second.First("layer")->message.First("param")->message.Scalar("lr_mult"), "0");
    EXPECT_EQ(second.fields.back().name, "input");
}

TEST(ProtoText, ReportsWhereTheTextIsMalformed) {
    const char* const bad[] = {
        "layer { name: \"x\"",       // unclosed block
        "name: \"unterminated\n\"",  // string across a line
        "name \"x\"",                // missing colon
        "layer { } }",               // stray brace
        "name: }",                   // no value
        "a: \"\\q\"",                // unknown escape
        "a: [1 2]",                  // list without comma
    };
    for (const char* text : bad) {
        try {
            pt::Parse(text);
            ADD_FAILURE() << "accepted: " << text;
        } catch (const cv::Exception& e) {
            EXPECT_EQ(e.code, cv::Error::StsParseError) << text;
            EXPECT_NE(e.err.find("line "), std::string::npos) << e.err;
        }
    }
}

}  // namespace
}  // namespace vora
