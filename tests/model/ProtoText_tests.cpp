#include <gtest/gtest.h>

#include <opencv2/core.hpp>

#include "model/ProtoText.h"

namespace vora {
namespace {

namespace pt = prototext;

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
    ASSERT_EQ(net.fields.size(), 3u);
    const std::vector<const pt::Field*> layers = net.All("layer");
    ASSERT_EQ(layers.size(), 2u);
    const pt::Field* shape = layers[0]->message.First("input_param")->message.First("shape");
    ASSERT_NE(shape, nullptr);
    EXPECT_EQ(shape->message.Scalars("dim"), (std::vector<std::string>{"1", "3"}));
    EXPECT_EQ(layers[1]->message.Scalar("name"), "pool");

    const pt::Message& params = layers[1]->message.First("pooling_param")->message;
    EXPECT_EQ(params.Scalar("pool"), "AVE");
    EXPECT_FALSE(params.First("pool")->quoted);
    EXPECT_EQ(params.Scalar("kernel_size"), "-1.5e-3");
    EXPECT_EQ(params.Scalar("missing", "fallback"), "fallback");
    EXPECT_EQ(params.Scalars("mean_value"), (std::vector<std::string>{"104", "117.5"}));
    EXPECT_EQ(params.All("shape").at(1)->message.Scalar("dim"), "2");
    EXPECT_EQ(params.First("empty"), nullptr);

    const std::string written = pt::Write(net);  // and back: the same tree, the same text
    const pt::Message again = pt::Parse(written);
    EXPECT_EQ(pt::Write(again), written);
    EXPECT_EQ(again.All("layer")[1]->message.First("pooling_param")->message.Scalars("mean_value"),
              params.Scalars("mean_value"));
}

TEST(ProtoText, DecodesStringEscapesJoinsLiteralsAndWritesThemBack) {
    const pt::Message message = pt::Parse(
        R"(a: "quote \" hash # brace { tab\t nl\n oct\101 hex\x42\x01 uni\u00e9 back\\" b: 'it''s' "!")");
    const std::string decoded = "quote \" hash # brace { tab\t nl\n octA hexB\x01 uni\xc3\xa9 back\\";
    EXPECT_EQ(message.Scalar("a"), decoded);
    EXPECT_TRUE(message.First("a")->quoted);
    EXPECT_EQ(message.Scalar("b"), "its!");
    EXPECT_EQ(pt::Parse(pt::Write(message)).Scalar("a"), decoded);
}

TEST(ProtoText, ReportsWhereTheTextIsMalformed) {
    for (const char* text : {
             "layer { name: \"x\"",       // unclosed block
             "name: \"unterminated\n\"",  // string across a line
             "name \"x\"",                // missing colon
             "layer { } }",               // stray brace
             "name: }",                   // no value
             "a: \"\\q\"",                // unknown escape
             "a: [1 2]",                  // list without comma
         }) {
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
