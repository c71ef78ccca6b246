// The TensorFlow.js converter on small graphs written here, with answers
// worked out by hand, run through the library's own network loader.

#include <cmath>
#include <fstream>
#include <type_traits>

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include "KitTesting.h"
#include "model/FeatureNetwork.h"
#include "modelkit/TfjsConverter.h"
#include "semantic/NetworkInput.h"

namespace {

using json = nlohmann::json;
using testing::HasSubstr;
using kit_testing::TempDir;
using vora::modelkit::ConversionError;
using vora::modelkit::ConvertTfjs;
using vora::modelkit::TfjsConversion;
namespace fs = std::filesystem;

// Graph attributes hold strings in base64.
std::string Base64(const std::string& word) {
    return word == "SAME" ? "U0FNRQ==" : word == "VALID" ? "VkFMSUQ=" : word == "NHWC" ? "TkhXQw==" : "?";
}

// A TensorFlow.js graph model written as the converter's input.
class Graph {
public:
    Graph& Input(const std::string& name, std::vector<int> dims) {
        json shape = json::array();
        for (int d : dims) shape.push_back({{"size", std::to_string(d)}});
        m_nodes.push_back({{"name", name}, {"op", "Placeholder"}, {"attr", {{"shape", {{"shape", {{"dim", shape}}}}}}}});
        return *this;
    }
    template <typename T>  // float or int32_t
    Graph& Values(const std::string& name, std::vector<int> shape, const std::vector<T>& values) {
        const std::string bytes(reinterpret_cast<const char*>(values.data()), values.size() * 4);
        return Stored(name, shape, std::is_same_v<T, float> ? "float32" : "int32", bytes, json());
    }
    Graph& Stored(const std::string& name, std::vector<int> shape, const std::string& dtype, const std::string& bytes,
                  const json& quantization) {
        m_nodes.push_back({{"name", name}, {"op", "Const"}});
        json entry = {{"name", name}, {"shape", shape}, {"dtype", dtype}};
        if (!quantization.is_null()) entry["quantization"] = quantization;
        m_weights.push_back(entry);
        m_bin += bytes;
        return *this;
    }
    Graph& Op(const std::string& name, const std::string& op, std::vector<std::string> inputs, json attrs = json::object()) {
        m_nodes.push_back({{"name", name}, {"op", op}, {"input", inputs}, {"attr", attrs}});
        return *this;
    }
    // A 4-D convolution filter H, W, in, out, channels last.
    Graph& Conv(const std::string& name, const std::string& input, std::vector<int> hwio, const std::vector<float>& filter,
                const std::string& padding = "VALID", int stride = 1) {
        Values<float>(name + "/filter", hwio, filter);
        const json strides = json::array({"1", std::to_string(stride), std::to_string(stride), "1"});
        return Op(name, "Conv2D", {input, name + "/filter"},
                  {{"padding", {{"s", Base64(padding)}}}, {"data_format", {{"s", Base64("NHWC")}}},
                   {"strides", {{"list", {{"i", strides}}}}}});
    }
    Graph& Transpose(const std::string& name, const std::string& input, std::vector<int32_t> perm) {
        Values<int32_t>(name + "/perm", {4}, perm);
        return Op(name, "Transpose", {input, name + "/perm"});
    }

    std::string Write(const fs::path& dir, size_t dropBytes = 0) const {
        json model = {{"format", "graph-model"},
                      {"modelTopology", {{"node", m_nodes}}},
                      {"weightsManifest", json::array({{{"paths", {"group1-shard1of1.bin"}}, {"weights", m_weights}}})}};
        std::ofstream(dir / "model.json") << model.dump();
        std::ofstream(dir / "group1-shard1of1.bin", std::ios::binary) << m_bin.substr(0, m_bin.size() - dropBytes);
        return (dir / "model.json").string();
    }

private:
    json m_nodes = json::array();
    json m_weights = json::array();
    std::string m_bin;
};

TfjsConversion Options(const std::string& model, const std::string& feature, int channels, int crop = 33) {
    TfjsConversion c;
    c.modelJson = model;
    c.featureTensor = feature;
    c.featureChannels = channels;
    c.crop = crop;
    return c;
}

// The feature the library computes for a uniform photo of colour bgr.
std::vector<float> FeatureOfFlatPhoto(const vora::modelkit::NetworkFiles& files, cv::Scalar bgr) {
    TempDir dir;
    vora::modelkit::WriteNetworkFiles(files, dir.path.string());
    auto network = vora::FeatureNetwork::Load((dir.path / vora::kNetworkDefinitionName).string(),
                                              (dir.path / vora::kNetworkWeightsName).string());
    const cv::Mat photo(100, 100, CV_8UC3, bgr);
    cv::Mat canvas;
    vora::PrepareNetworkImage(photo, canvas, vora::kNetworkImageSize, vora::kNetworkInputSize);
    return network->Forward(canvas);
}

std::string RefusalOf(const TfjsConversion& options) {
    try {
        ConvertTfjs(options);
    } catch (const ConversionError& e) {
        return e.what();
    }
    return "(converted)";
}

// Channels-first input, transposed around a channels-last 1 x 1 convolution
// and back, joined along the channels-last axis -1 and averaged over the
// channels-last axes 1, 2: every axis has to be remapped for the right
// answer. The photo is B, G, R = 10, 20, 40; the network reads R, G, B with
// mean (1, 2, 4) and std (2, 4, 8).
TEST(TfjsConverter, RemapsAxesAndFoldsNormalisationIntoTheFirstConvolution) {
    TempDir dir;
    Graph g;
    g.Input("image", {1, 3, 416, 416})
        .Transpose("to_last", "image", {0, 2, 3, 1})
        // out0 = R', out1 = B' (normalised), so the swap shows.
        .Conv("conv", "to_last", {1, 1, 3, 2}, {1, 0, 0, 0, 0, 1})
        .Values<float>("bias", {2}, {100, 200})
        .Op("biased", "BiasAdd", {"conv", "bias"})
        .Transpose("to_first", "biased", {0, 3, 1, 2})
        .Transpose("again_last", "to_first", {0, 2, 3, 1})
        .Values<int32_t>("axis", {}, {-1})
        .Op("joined", "ConcatV2", {"again_last", "biased", "axis"})
        .Values<int32_t>("hw", {2}, {1, 2})
        .Op("mean", "Mean", {"joined", "hw"}, {{"keep_dims", {{"b", true}}}});
    TfjsConversion options = Options(g.Write(dir.path), "mean:0", 4);
    options.mean = {{1, 2, 4}};
    options.std = {{2, 4, 8}};
    // R' = (40 - 1) / 2 + 100, B' = (10 - 4) / 8 + 200.
    const std::vector<float> expected{119.5f, 200.75f, 119.5f, 200.75f};
    EXPECT_EQ(FeatureOfFlatPhoto(ConvertTfjs(options), cv::Scalar(10, 20, 40)), expected);

    // Read as B, G, R, the same filter takes B first: (10 - 1) / 2, (40 - 4) / 8.
    options.rgbInput = false;
    const std::vector<float> swapped{104.5f, 204.5f, 104.5f, 204.5f};
    EXPECT_EQ(FeatureOfFlatPhoto(ConvertTfjs(options), cv::Scalar(10, 20, 40)), swapped);
}

TEST(TfjsConverter, DecodesHalfAndAffineWeightsExactly) {
    // 1.5 and -2 are read through the weights below.
    EXPECT_EQ(vora::modelkit::HalfToFloat(0x0001), std::ldexp(1.0f, -24));  // smallest subnormal
    EXPECT_EQ(vora::modelkit::HalfToFloat(0x03FF), std::ldexp(1023.0f, -24));  // largest subnormal
    EXPECT_EQ(vora::modelkit::HalfToFloat(0x7BFF), 65504.0f);
    EXPECT_EQ(vora::modelkit::HalfToFloat(0xFC00), -INFINITY);
    EXPECT_TRUE(std::isnan(vora::modelkit::HalfToFloat(0x7E00)));

    // Biases stored as float16 and as uint8 / uint16 with q x scale + min,
    // each read back in the converted weights.
    TempDir dir;
    Graph g;
    const std::string half("\x00\x3E\x00\xC0", 4);         // 1.5, -2
    const std::string bytes("\x00\x03\xFF", 3);            // 0, 3, 255
    const std::string words("\x00\x00\x10\x00", 4);        // 0, 16
    g.Input("image", {1, 416, 416, 3})
        .Stored("w", {1, 1, 3, 2}, "float32", half + half + half, json{{"dtype", "float16"}})
        .Op("conv", "Conv2D", {"image", "w"})
        .Stored("b", {2}, "float32", half, json{{"dtype", "float16"}})
        .Op("c1", "BiasAdd", {"conv", "b"})
        .Values<float>("w2", {1, 1, 2, 3}, {1, 0, 0, 0, 1, 0})
        .Op("conv2", "Conv2D", {"c1", "w2"})
        .Stored("b2", {3}, "float32", bytes, json{{"dtype", "uint8"}, {"scale", 0.1}, {"min", -1.0}})
        .Op("c2", "Add", {"conv2", "b2"})
        .Values<float>("w3", {1, 1, 3, 2}, {1, 0, 0, 1, 0, 0})
        .Op("conv3", "Conv2D", {"c2", "w3"})
        .Stored("b3", {2}, "float32", words, json{{"dtype", "uint16"}, {"scale", 0.25}, {"min", 0.5}})
        .Op("c3", "AddV2", {"b3", "conv3"});
    const vora::modelkit::NetworkFiles files = ConvertTfjs(Options(g.Write(dir.path), "c3", 2));
    ASSERT_EQ(files.weights.size(), 3u);
    EXPECT_EQ(files.weights[0].blobs[0].data, (std::vector<float>{1.5f, 1.5f, 1.5f, -2.0f, -2.0f, -2.0f}));
    EXPECT_EQ(files.weights[0].blobs[1].data, (std::vector<float>{1.5f, -2.0f}));
    // In double, then rounded once: 3 x 0.1 - 1 = -0.7 (not the float sum).
    EXPECT_EQ(files.weights[1].blobs[1].data, (std::vector<float>{-1.0f, float(3 * 0.1 + -1.0), float(255 * 0.1 + -1.0)}));
    EXPECT_EQ(files.weights[2].blobs[1].data, (std::vector<float>{0.5f, 4.5f}));
}

// TF's SAME padding on an even size is 0 before and 1 after for a 3 x 3
// stride-2 window, and TF pooling rounds its size down where the network
// format rounds up: both are refused at the crop where they occur, and the
// refusal names crops that work.
TEST(TfjsConverter, RefusesCropsWhoseSizesTheNetworkFormatCannotKeep) {
    TempDir dir;
    Graph same;
    same.Input("image", {1, 416, 416, 3}).Conv("conv", "image", {3, 3, 3, 1}, std::vector<float>(27, 1.0f), "SAME", 2);
    const std::string sameModel = same.Write(dir.path);
    EXPECT_THAT(RefusalOf(Options(sameModel, "conv", 1, 32)),
                testing::AllOf(HasSubstr("pads 0 before and 1 after on an input of 32"), HasSubstr("227")));
    EXPECT_NO_THROW(ConvertTfjs(Options(sameModel, "conv", 1, 33)));

    TempDir dir2;
    Graph pool;
    pool.Input("image", {1, 416, 416, 3})
        .Conv("conv", "image", {1, 1, 3, 1}, {1, 1, 1})
        .Op("pool", "MaxPool", {"conv"},
            {{"padding", {{"s", Base64("VALID")}}},
             {"ksize", {{"list", {{"i", {"1", "3", "3", "1"}}}}}},
             {"strides", {{"list", {{"i", {"1", "2", "2", "1"}}}}}}});
    const std::string poolModel = pool.Write(dir2.path);
    EXPECT_THAT(RefusalOf(Options(poolModel, "pool", 1, 34)),
                HasSubstr("gives 16 from 34, but the network format would give 17"));
    EXPECT_NO_THROW(ConvertTfjs(Options(poolModel, "pool", 1, 33)));
}

TEST(TfjsConverter, RefusalsNameTheirCause) {
    TempDir dir;
    Graph g;
    g.Input("image", {1, 416, 416, 3})
        .Conv("conv", "image", {1, 1, 3, 2}, {1, 0, 0, 1, 0, 0})
        .Op("squashed", "Sigmoid", {"conv"})
        .Op("added", "Add", {"image", "image"});
    const std::string model = g.Write(dir.path);
    const struct {
        TfjsConversion options;
        const char* mentions;
    } cases[] = {
        {Options(model, "squashed", 2), "unsupported op Sigmoid (node squashed)"},
        {Options(model, "nowhere", 2), "no tensor named nowhere"},
        {Options(model, "conv", 512), "has 2 channels; the library reads 512"},
        {Options(model, "conv", 2, 228), "the crop must be 1 to 227"},
        {Options(model, "added", 3), "must fold into a first convolution"},
    };
    for (const auto& c : cases) EXPECT_THAT(RefusalOf(c.options), HasSubstr(c.mentions));

    TempDir truncated;
    EXPECT_THAT(RefusalOf(Options(g.Write(truncated.path, 1), "conv", 2)), HasSubstr("truncated shard"));

    TempDir strings;
    Graph s;
    s.Input("image", {1, 416, 416, 3}).Stored("names", {1}, "string", "abcd", json());
    EXPECT_THAT(RefusalOf(Options(s.Write(strings.path), "image", 3)), HasSubstr("weight names has dtype string"));
}

}  // namespace
