#include "modelkit/TfjsConverter.h"

#include <algorithm>
#include <cfloat>
#include <cmath>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <sstream>

#include <nlohmann/json.hpp>

#include "semantic/NetworkInput.h"

namespace fs = std::filesystem;
using json = nlohmann::json;

namespace vora {
namespace modelkit {

const char* const kNanodetModelName = "nanodet.json";
const char* const kNanodetWeightsName = "nanodet.bin";

TfjsConversion NanodetConversion(const std::string& folder) {
    TfjsConversion c;
    c.modelJson = (fs::path(folder) / kNanodetModelName).string();
    c.featureTensor = "PartitionedCall/onnx_tf_prefix_Concat_62";
    c.mean = {{103.53f, 116.28f, 123.675f}};
    c.std = {{57.375f, 57.12f, 58.395f}};
    c.rgbInput = false;
    c.crop = 225;
    c.networkName = "vora_nanodet_backbone";
    return c;
}

float HalfToFloat(uint16_t half) {
    const uint32_t sign = static_cast<uint32_t>(half & 0x8000u) << 16;
    const uint32_t exponent = (half >> 10) & 0x1Fu;
    uint32_t mantissa = half & 0x3FFu;
    uint32_t bits;
    if (exponent == 0x1F) {
        bits = sign | 0x7F800000u | (mantissa << 13);
    } else if (exponent != 0) {
        bits = sign | ((exponent + 112) << 23) | (mantissa << 13);
    } else if (mantissa == 0) {
        bits = sign;
    } else {
        // Subnormal half: normalise into a float exponent.
        int shift = 0;
        while ((mantissa & 0x400u) == 0) {
            mantissa <<= 1;
            ++shift;
        }
        bits = sign | (static_cast<uint32_t>(113 - shift) << 23) | ((mantissa & 0x3FFu) << 13);
    }
    float value;
    std::memcpy(&value, &bits, sizeof value);
    return value;
}

namespace {

[[noreturn]] void Refuse(const std::string& message) { throw ConversionError(message); }

// A refusal that depends on the crop; the caller suggests crops that work.
class CropError : public ConversionError {
public:
    using ConversionError::ConversionError;
};

struct Constant {
    std::vector<int64_t> shape;
    std::vector<float> values;  // float constants
    std::vector<int64_t> ints;  // int32 constants
    bool isInt = false;
    size_t Count() const { return isInt ? ints.size() : values.size(); }
};

// ---- model.json and the weight shards -------------------------------------

std::string ReadFileBytes(const fs::path& path) {
    std::ifstream file(path, std::ios::binary);
    if (!file) Refuse("cannot read " + path.string());
    std::ostringstream out;
    out << file.rdbuf();
    return out.str();
}

std::string Base64Decode(const std::string& text) {
    std::string out;
    uint32_t buffer = 0;
    int bits = 0;
    for (char ch : text) {
        int v;
        if (ch >= 'A' && ch <= 'Z') v = ch - 'A';
        else if (ch >= 'a' && ch <= 'z') v = ch - 'a' + 26;
        else if (ch >= '0' && ch <= '9') v = ch - '0' + 52;
        else if (ch == '+' || ch == '-') v = 62;
        else if (ch == '/' || ch == '_') v = 63;
        else continue;  // padding
        buffer = (buffer << 6) | static_cast<uint32_t>(v);
        bits += 6;
        if (bits >= 8) {
            bits -= 8;
            out.push_back(static_cast<char>((buffer >> bits) & 0xFFu));
        }
    }
    return out;
}

int64_t JsonInt(const json& value) {
    // Protobuf's JSON writes 64-bit integers as strings.
    if (value.is_string()) return std::stoll(value.get<std::string>());
    return value.get<int64_t>();
}

template <typename T>
T ReadLittle(const char* p) {
    T value;
    std::memcpy(&value, p, sizeof value);  // little-endian, as this machine is
    return value;
}

std::map<std::string, Constant> ReadWeights(const json& manifest, const fs::path& folder) {
    std::map<std::string, Constant> constants;
    if (!manifest.is_array()) Refuse("model.json has no weightsManifest list");
    for (const json& group : manifest) {
        std::string bytes;
        for (const json& path : group.at("paths")) bytes += ReadFileBytes(folder / path.get<std::string>());
        size_t offset = 0;
        for (const json& entry : group.at("weights")) {
            const std::string name = entry.at("name").get<std::string>();
            const std::string dtype = entry.at("dtype").get<std::string>();
            Constant constant;
            size_t count = 1;
            for (const json& dim : entry.at("shape")) {
                constant.shape.push_back(JsonInt(dim));
                count *= static_cast<size_t>(constant.shape.back());
            }
            std::string stored = dtype;
            double scale = 1.0, minimum = 0.0;
            const bool quantized = entry.contains("quantization");
            if (quantized) {
                const json& q = entry.at("quantization");
                stored = q.at("dtype").get<std::string>();
                if (q.contains("scale")) scale = q.at("scale").get<double>();
                if (q.contains("min")) minimum = q.at("min").get<double>();
            }
            if (dtype != "float32" && dtype != "int32")
                Refuse("weight " + name + " has dtype " + dtype + ", which the converter does not handle");
            size_t width;
            if (stored == "float32" || stored == "int32") width = 4;
            else if (stored == "uint16" || stored == "float16") width = 2;
            else if (stored == "uint8") width = 1;
            else Refuse("weight " + name + " is stored as " + stored + ", which the converter does not handle");
            if (quantized && stored == dtype) Refuse("weight " + name + " has a quantization of its own dtype");
            if (bytes.size() - offset < count * width || offset > bytes.size())
                Refuse("the weight shards end after " + std::to_string(bytes.size()) + " bytes, but weight " + name +
                       " needs bytes up to " + std::to_string(offset + count * width) + " (a truncated shard?)");
            const char* p = bytes.data() + offset;
            offset += count * width;

            constant.isInt = dtype == "int32";
            auto store = [&](double value) {
                // Quantised integers are rounded back, as the original reader does.
                if (constant.isInt) constant.ints.push_back(static_cast<int64_t>(std::llround(value)));
                else constant.values.push_back(static_cast<float>(value));
            };
            for (size_t i = 0; i < count; ++i) {
                if (stored == "float32") {
                    constant.values.push_back(ReadLittle<float>(p + 4 * i));
                } else if (stored == "int32") {
                    constant.ints.push_back(ReadLittle<int32_t>(p + 4 * i));
                } else if (stored == "float16") {
                    store(HalfToFloat(ReadLittle<uint16_t>(p + 2 * i)));
                } else {
                    // Affine: q * scale + min in double, rounded once to the
                    // stored type, as the original reader computes it.
                    const double q = stored == "uint8" ? static_cast<uint8_t>(p[i]) : ReadLittle<uint16_t>(p + 2 * i);
                    const double product = q * scale;
                    store(product + minimum);
                }
            }
            constants[name] = std::move(constant);
        }
    }
    return constants;
}

// ---- attributes -------------------------------------------------------------

const json* Attr(const json& node, const std::string& name) {
    auto attrs = node.find("attr");
    if (attrs == node.end()) return nullptr;
    auto it = attrs->find(name);
    return it == attrs->end() ? nullptr : &*it;
}

std::string AttrString(const json& node, const std::string& name, const std::string& fallback) {
    const json* a = Attr(node, name);
    if (!a || !a->contains("s")) return fallback;
    return Base64Decode(a->at("s").get<std::string>());
}

std::vector<int64_t> AttrInts(const json& node, const std::string& name) {
    std::vector<int64_t> out;
    const json* a = Attr(node, name);
    if (!a || !a->contains("list")) return out;
    const json& list = a->at("list");
    if (list.contains("i"))
        for (const json& v : list.at("i")) out.push_back(JsonInt(v));
    return out;
}

std::vector<std::string> AttrStrings(const json& node, const std::string& name) {
    std::vector<std::string> out;
    const json* a = Attr(node, name);
    if (!a || !a->contains("list")) return out;
    const json& list = a->at("list");
    if (list.contains("s"))
        for (const json& v : list.at("s")) out.push_back(Base64Decode(v.get<std::string>()));
    return out;
}

double AttrFloat(const json& node, const std::string& name, double fallback) {
    const json* a = Attr(node, name);
    if (!a || !a->contains("f")) return fallback;
    return a->at("f").get<double>();
}

bool AttrBool(const json& node, const std::string& name, bool fallback) {
    const json* a = Attr(node, name);
    if (!a || !a->contains("b")) return fallback;
    return a->at("b").get<bool>();
}

// ---- the conversion ---------------------------------------------------------

// Caffe blobs are N, C, H, W. A layout maps each axis of the graph's tensor
// to the blob axis that holds it, so a Transpose costs nothing.
using Layout = std::array<int, 4>;
constexpr Layout kChannelsFirst{{0, 1, 2, 3}};
constexpr Layout kChannelsLast{{0, 2, 3, 1}};

struct Tensor {
    std::string top;
    Layout layout = kChannelsFirst;
    std::array<int, 4> shape{{1, 1, 1, 1}};  // blob axes
    int rank = 4;
    bool rawInput = false;  // the network's input before its normalisation
    // A Pad not written yet: the next convolution or pooling takes it as its
    // own padding (blob axes; before and after).
    bool padded = false;
    std::array<int, 4> padBefore{{0, 0, 0, 0}};
    std::array<int, 4> padAfter{{0, 0, 0, 0}};
    float padValue = 0.0f;
    int biasFreeConv = -1;  // a convolution without bias whose only output this is
};

struct Layer {
    std::string name;
    std::string type;
    std::vector<std::string> bottoms;
    std::string top;
    std::string params;  // the parameter block, convolutions excepted
    // Convolutions: the parameters are written at the end, once the bias is known.
    bool isConvolution = false;
    int outputs = 0, kernelH = 0, kernelW = 0, strideH = 1, strideW = 1, padH = 0, padW = 0, group = 1;
    bool hasBias = false;
    std::vector<WeightsBlob> blobs;
};

Layer PlainLayer(const std::string& name, const std::string& type, std::vector<std::string> bottoms,
                 const std::string& params) {
    Layer layer;
    layer.name = name;
    layer.type = type;
    layer.bottoms = std::move(bottoms);
    layer.top = name;
    layer.params = params;
    return layer;
}

std::string FloatText(float value) {
    std::ostringstream out;
    out.precision(9);
    out << value;
    return out.str();
}

std::string ShapeText(const std::array<int, 4>& shape) {
    return std::to_string(shape[1]) + " x " + std::to_string(shape[2]) + " x " + std::to_string(shape[3]);
}

struct InputRef {
    std::string node;
    int index = 0;
};

InputRef ParseInput(const std::string& text) {
    InputRef ref;
    ref.node = text;
    const size_t colon = text.rfind(':');
    if (colon != std::string::npos) {
        const std::string index = text.substr(colon + 1);
        if (!index.empty() && std::all_of(index.begin(), index.end(), [](char c) { return c >= '0' && c <= '9'; })) {
            ref.node = text.substr(0, colon);
            ref.index = std::stoi(index);
        }
    }
    return ref;
}

class Converter {
public:
    Converter(const TfjsConversion& options, const std::map<std::string, const json*>& nodes,
              const std::map<std::string, Constant>& constants, bool withWeights)
        : m_options(options), m_nodes(nodes), m_constants(constants), m_withWeights(withWeights) {}

    NetworkFiles Run(const std::string& feature) {
        CountConsumers(feature);
        const Tensor& out = Value(feature);
        if (out.padded) Refuse("the feature tensor " + feature + " is a Pad; name a tensor a layer computes");
        if (out.rank != 4 && out.rank != 2) Refuse("the feature tensor " + feature + " is not an image-like tensor");
        if (out.shape[1] != m_options.featureChannels)
            Refuse("the feature tensor " + feature + " has " + std::to_string(out.shape[1]) +
                   " channels; the library reads " + std::to_string(m_options.featureChannels));
        if (!m_sawInputConvolution) Refuse("the input never reaches a convolution to fold the normalisation into");
        m_layers.push_back(PlainLayer("feature", "Pooling", {out.top},
                                      "  pooling_param {\n    pool: AVE\n    global_pooling: true\n  }\n"));
        return Write();
    }

private:
    const json& Node(const std::string& name) const {
        auto it = m_nodes.find(name);
        if (it == m_nodes.end()) Refuse("no tensor named " + name + " in the model");
        return *it->second;
    }

    std::vector<InputRef> Inputs(const json& node) const {
        std::vector<InputRef> refs;
        if (node.contains("input"))
            for (const json& input : node.at("input")) {
                const std::string text = input.get<std::string>();
                if (!text.empty() && text[0] == '^') continue;  // control edges carry no data
                refs.push_back(ParseInput(text));
            }
        return refs;
    }

    // How often each ancestor's output is read, to know when a bias may fold.
    void CountConsumers(const std::string& feature) {
        std::set<std::string> seen;
        std::vector<std::string> stack{feature};
        while (!stack.empty()) {
            const std::string name = stack.back();
            stack.pop_back();
            if (!seen.insert(name).second) continue;
            for (const InputRef& ref : Inputs(Node(name))) {
                ++m_consumers[ref.node];
                stack.push_back(ref.node);
            }
        }
    }

    const Constant& ConstantInput(const json& node, const InputRef& ref) const {
        const json& source = Node(ref.node);
        if (source.at("op").get<std::string>() != "Const")
            Refuse(Describe(node) + " needs a constant as input " + ref.node + ", which is computed");
        auto it = m_constants.find(ref.node);
        if (it == m_constants.end()) Refuse("constant " + ref.node + " has no entry in the weights manifest");
        return it->second;
    }

    static std::string Describe(const json& node) {
        return node.at("op").get<std::string>() + " " + node.at("name").get<std::string>();
    }

    // The tensor a node computes, converting it first if needed.
    const Tensor& Value(const std::string& name) {
        auto done = m_values.find(name);
        if (done != m_values.end()) return done->second;
        if (!m_inProgress.insert(name).second) Refuse("the graph has a cycle through " + name);
        const json& node = Node(name);
        Tensor value = Convert(node);
        m_inProgress.erase(name);
        if (m_consumers[name] > 1) value.biasFreeConv = -1;
        return m_values.emplace(name, std::move(value)).first->second;
    }

    Tensor TensorInput(const json& node, const InputRef& ref) {
        if (ref.index != 0) Refuse(Describe(node) + " reads output " + std::to_string(ref.index) + " of " + ref.node +
                                   "; only single-output ops are converted");
        const json& source = Node(ref.node);
        if (source.at("op").get<std::string>() == "Const")
            Refuse(Describe(node) + " takes the constant " + ref.node + " where the converter expects an image");
        Tensor value = Value(ref.node);
        const std::string op = node.at("op").get<std::string>();
        const bool takesRawInput = op == "Identity" || op == "Transpose" || op == "Pad" || op == "PadV2" ||
                                   op == "Conv2D" || op == "_FusedConv2D";
        if (value.rawInput && !takesRawInput)
            Refuse("the input normalisation must fold into a first convolution, but the input reaches " +
                   Describe(node) + " first");
        return value;
    }

    static void RequireRank4(const json& node, const Tensor& t) {
        if (t.rank != 4) Refuse(Describe(node) + " reads a tensor that is not 4-D");
    }

    Tensor Convert(const json& node) {
        const std::string op = node.at("op").get<std::string>();
        const std::vector<InputRef> in = Inputs(node);
        if (op == "Placeholder") return Placeholder(node);
        if (op == "Const") Refuse("the feature tensor must be computed, " + Describe(node) + " is a constant");
        if (in.empty()) Refuse(Describe(node) + " has no inputs");
        if (op == "Identity") return TensorInput(node, in[0]);
        if (op == "Transpose") return Transpose(node, in);
        if (op == "Pad" || op == "PadV2") return Pad(node, in, op == "PadV2");
        if (op == "Conv2D" || op == "_FusedConv2D") return Convolution(node, in, op == "_FusedConv2D");
        if (op == "Add" || op == "AddV2" || op == "BiasAdd") return Add(node, in, op == "BiasAdd");
        if (op == "Relu" || op == "LeakyRelu") {
            Tensor x = TensorInput(node, in[0]);
            RequireNoPad(node, x);
            return Activation(node.at("name").get<std::string>(), x, op == "Relu" ? 0.0 : AttrFloat(node, "alpha", 0.2));
        }
        if (op == "MaxPool" || op == "AvgPool") return Pooling(node, in, op == "MaxPool");
        if (op == "ConcatV2") return Concat(node, in);
        if (op == "Mean") return Mean(node, in);
        Refuse("unsupported op " + op + " (node " + node.at("name").get<std::string>() +
               "); the converter handles Conv2D, _FusedConv2D, Add, AddV2, BiasAdd, Relu, LeakyRelu, Pad, PadV2, "
               "MaxPool, AvgPool, ConcatV2, Mean, Transpose and Identity");
    }

    void RequireNoPad(const json& node, const Tensor& t) const {
        if (t.padded) Refuse(Describe(node) + " reads a Pad; only a convolution or pooling can take the padding");
    }

    Tensor Placeholder(const json& node) {
        std::vector<int64_t> dims;
        if (const json* shape = Attr(node, "shape"))
            if (shape->contains("shape") && shape->at("shape").contains("dim"))
                for (const json& d : shape->at("shape").at("dim")) dims.push_back(d.contains("size") ? JsonInt(d.at("size")) : -1);
        if (m_inputSeen) Refuse("the feature depends on a second input, " + node.at("name").get<std::string>());
        m_inputSeen = true;
        Tensor t;
        t.top = "data";
        t.rawInput = true;
        if (dims.size() == 4 && dims[1] == 3 && dims[3] != 3) t.layout = kChannelsFirst;
        else if (dims.size() == 4 && dims[3] == 3) t.layout = kChannelsLast;
        else Refuse("the input " + node.at("name").get<std::string>() + " is not a batch of three-channel images");
        t.shape = {{1, 3, m_options.crop, m_options.crop}};
        return t;
    }

    Tensor Transpose(const json& node, const std::vector<InputRef>& in) {
        if (in.size() != 2) Refuse(Describe(node) + " needs a permutation");
        Tensor x = TensorInput(node, in[0]);
        RequireRank4(node, x);
        const Constant& perm = ConstantInput(node, in[1]);
        if (!perm.isInt || perm.ints.size() != 4) Refuse(Describe(node) + " has a permutation that is not 4 integers");
        Tensor out = x;
        for (int i = 0; i < 4; ++i) {
            const int64_t p = perm.ints[i];
            if (p < 0 || p > 3) Refuse(Describe(node) + " has an axis out of range");
            out.layout[i] = x.layout[p];
        }
        return out;
    }

    // Graph axis (negative counts from the end) to blob axis.
    static int BlobAxis(const json& node, const Tensor& t, int64_t axis) {
        if (axis < 0) axis += t.rank;
        if (axis < 0 || axis >= t.rank) Refuse(Describe(node) + " names axis " + std::to_string(axis) + " of a " +
                                               std::to_string(t.rank) + "-D tensor");
        return t.rank == 4 ? t.layout[axis] : static_cast<int>(axis);
    }

    Tensor Pad(const json& node, const std::vector<InputRef>& in, bool withValue) {
        if (in.size() < 2) Refuse(Describe(node) + " needs paddings");
        Tensor x = TensorInput(node, in[0]);
        RequireRank4(node, x);
        const Constant& pads = ConstantInput(node, in[1]);
        if (!pads.isInt || pads.ints.size() != 8) Refuse(Describe(node) + " has paddings that are not 4 x 2 integers");
        float value = 0.0f;
        if (withValue && in.size() > 2) {
            const Constant& v = ConstantInput(node, in[2]);
            if (v.Count() != 1) Refuse(Describe(node) + " has a pad value that is not a scalar");
            value = v.isInt ? static_cast<float>(v.ints[0]) : v.values[0];
        }
        if (AttrString(node, "mode", "CONSTANT") != "CONSTANT") Refuse(Describe(node) + " pads by reflection");
        Tensor out = x;
        if (x.padded && x.padValue != value) Refuse(Describe(node) + " pads a Pad with a different value");
        out.padded = true;
        out.padValue = value;
        out.biasFreeConv = -1;
        for (int i = 0; i < 4; ++i) {
            const int axis = x.layout[i];
            if (pads.ints[2 * i] < 0 || pads.ints[2 * i + 1] < 0) Refuse(Describe(node) + " crops (negative padding)");
            out.padBefore[axis] += static_cast<int>(pads.ints[2 * i]);
            out.padAfter[axis] += static_cast<int>(pads.ints[2 * i + 1]);
        }
        if (out.padBefore[0] || out.padAfter[0] || out.padBefore[1] || out.padAfter[1])
            Refuse(Describe(node) + " pads the batch or channel axis");
        return out;
    }

    struct Window {
        int kernel[2] = {1, 1};   // H, W
        int stride[2] = {1, 1};
        int pad[2] = {0, 0};
        int out[2] = {1, 1};
    };

    // The spatial geometry of a convolution or pooling over x: the graph's
    // own sizes (explicit pads, then SAME or VALID, floor) must equal the
    // network format's (symmetric pads; floor for convolution, ceil for
    // pooling), or the layer is refused at this crop.
    Window Geometry(const json& node, const Tensor& x, const int kernel[2], const int stride[2], bool pooling) {
        const std::string padding = AttrString(node, "padding", "VALID");
        const bool channelsLast = AttrString(node, "data_format", "NHWC") == "NHWC";
        if (x.layout != (channelsLast ? kChannelsLast : kChannelsFirst))
            Refuse(Describe(node) + " reads its input in another axis order than it was written (layout not understood)");
        std::vector<int64_t> explicitPads = AttrInts(node, "explicit_paddings");
        Window w;
        for (int a = 0; a < 2; ++a) {
            const int axis = 2 + a;
            const int size = x.shape[axis];
            int before = x.padBefore[axis], after = x.padAfter[axis];
            if (padding == "EXPLICIT") {
                if (explicitPads.size() != 8) Refuse(Describe(node) + " has explicit paddings that are not 4 x 2");
                const int graphAxis = channelsLast ? 1 + a : 2 + a;
                before += static_cast<int>(explicitPads[2 * graphAxis]);
                after += static_cast<int>(explicitPads[2 * graphAxis + 1]);
            }
            const int padded = size + before + after;
            int graphOut;
            if (padding == "SAME") {
                graphOut = (padded + stride[a] - 1) / stride[a];
                const int total = std::max((graphOut - 1) * stride[a] + kernel[a] - padded, 0);
                before += total / 2;
                after += total - total / 2;
            } else if (padding == "VALID" || padding == "EXPLICIT") {
                if (padded < kernel[a])
                    throw CropError("at crop " + std::to_string(m_options.crop) + ", " + Describe(node) +
                                    " gets an input smaller than its kernel");
                graphOut = (padded - kernel[a]) / stride[a] + 1;
            } else {
                Refuse(Describe(node) + " has padding " + padding + ", which the converter does not handle");
            }
            if (before != after)
                throw CropError("at crop " + std::to_string(m_options.crop) + ", " + Describe(node) + " pads " +
                                std::to_string(before) + " before and " + std::to_string(after) +
                                " after on an input of " + std::to_string(size) +
                                ", but the network format pads both sides alike");
            int formatOut;
            const int span = size + 2 * before - kernel[a];
            if (span < 0)
                throw CropError("at crop " + std::to_string(m_options.crop) + ", " + Describe(node) +
                                " gets an input smaller than its kernel");
            if (pooling) {
                formatOut = (span + stride[a] - 1) / stride[a] + 1;
                if (before > 0 && (formatOut - 1) * stride[a] >= size + before) --formatOut;
                if (before >= kernel[a]) Refuse(Describe(node) + " pads by its kernel size or more");
            } else {
                formatOut = span / stride[a] + 1;
            }
            if (formatOut != graphOut)
                throw CropError("at crop " + std::to_string(m_options.crop) + ", " + Describe(node) + " gives " +
                                std::to_string(graphOut) + " from " + std::to_string(size) +
                                ", but the network format would give " + std::to_string(formatOut) +
                                (pooling ? " (pooling rounds up there, down here)" : ""));
            w.kernel[a] = kernel[a];
            w.stride[a] = stride[a];
            w.pad[a] = before;
            w.out[a] = graphOut;
        }
        return w;
    }

    static void SpatialPair(const json& node, const std::vector<int64_t>& four, bool channelsLast, int out[2],
                            const char* what) {
        if (four.empty()) return;
        if (four.size() != 4) Refuse(Describe(node) + " has " + what + " that are not 4 values");
        const int h = channelsLast ? 1 : 2;
        if (four[0] != 1 || four[channelsLast ? 3 : 1] != 1)
            Refuse(Describe(node) + " has " + what + " across the batch or channels");
        out[0] = static_cast<int>(four[h]);
        out[1] = static_cast<int>(four[h + 1]);
        if (out[0] < 1 || out[1] < 1) Refuse(Describe(node) + " has " + what + " below 1");
    }

    Tensor Convolution(const json& node, const std::vector<InputRef>& in, bool fused) {
        const std::string name = node.at("name").get<std::string>();
        if (in.size() < 2) Refuse(Describe(node) + " needs a filter");
        Tensor x = TensorInput(node, in[0]);
        RequireRank4(node, x);
        if (x.padded && x.padValue != 0.0f) Refuse(Describe(node) + " reads a Pad with a value other than 0");
        const Constant& filter = ConstantInput(node, in[1]);
        if (filter.isInt || filter.shape.size() != 4) Refuse(Describe(node) + " has a filter that is not 4-D float");
        for (int64_t d : AttrInts(node, "dilations"))
            if (d != 1) Refuse(Describe(node) + " is dilated, which the converter does not handle");
        const bool channelsLast = AttrString(node, "data_format", "NHWC") == "NHWC";
        int stride[2] = {1, 1};
        SpatialPair(node, AttrInts(node, "strides"), channelsLast, stride, "strides");
        const int kh = static_cast<int>(filter.shape[0]), kw = static_cast<int>(filter.shape[1]);
        const int ci = static_cast<int>(filter.shape[2]), co = static_cast<int>(filter.shape[3]);
        const int kernel[2] = {kh, kw};
        const Window w = Geometry(node, x, kernel, stride, false);
        const int channels = x.shape[1];
        if (ci <= 0 || channels % ci != 0 || co % (channels / ci) != 0)
            Refuse(Describe(node) + " has a filter for " + std::to_string(ci) + " channels on an input of " +
                   std::to_string(channels));
        const int group = channels / ci;

        Layer layer;
        layer.name = name;
        layer.type = "Convolution";
        layer.bottoms = {x.top};
        layer.top = name;
        layer.isConvolution = true;
        layer.outputs = co;
        layer.kernelH = kh;
        layer.kernelW = kw;
        layer.strideH = w.stride[0];
        layer.strideW = w.stride[1];
        layer.padH = w.pad[0];
        layer.padW = w.pad[1];
        layer.group = group;
        std::vector<float> weights;
        if (x.rawInput) {
            if (group != 1) Refuse(Describe(node) + " is grouped; the input normalisation cannot fold into it");
            m_sawInputConvolution = true;
        }
        if (m_withWeights) {
            // Filters are H, W, in, out in the graph and out, in, H, W here.
            weights.resize(static_cast<size_t>(co) * ci * kh * kw);
            size_t i = 0;
            for (int o = 0; o < co; ++o)
                for (int c = 0; c < ci; ++c) {
                    // The library feeds B, G, R: blob channel c holds the
                    // network's channel `source`; 1 / std of that channel
                    // folds into its weights (its zero padding stays zero).
                    const int source = x.rawInput && m_options.rgbInput ? 2 - c : c;
                    for (int y = 0; y < kh; ++y)
                        for (int xx = 0; xx < kw; ++xx) {
                            float v = filter.values[((static_cast<size_t>(y) * kw + xx) * ci + source) * co + o];
                            if (x.rawInput) v = static_cast<float>(double(v) / double(m_options.std[source]));
                            weights[i++] = v;
                        }
                }
        }
        layer.blobs.push_back({{co, ci, kh, kw}, std::move(weights)});

        Tensor out;
        out.top = name;
        out.layout = x.layout;
        out.shape = {{1, co, w.out[0], w.out[1]}};
        if (!fused) {
            out.biasFreeConv = static_cast<int>(m_layers.size());
            m_layers.push_back(std::move(layer));
            return out;
        }
        const std::vector<std::string> ops = AttrStrings(node, "fused_ops");
        if (ops.empty() || ops[0] != "BiasAdd" || ops.size() > 2 || in.size() < 3)
            Refuse(Describe(node) + " fuses " + (ops.empty() ? std::string("nothing") : ops[0]) +
                   "; the converter handles BiasAdd with an optional Relu or LeakyRelu");
        const Constant& bias = ConstantInput(node, in[2]);
        if (bias.isInt || bias.values.size() != static_cast<size_t>(co)) Refuse(Describe(node) + " has a bias of the wrong size");
        layer.hasBias = true;
        layer.blobs.push_back({{co}, m_withWeights ? bias.values : std::vector<float>()});
        m_layers.push_back(std::move(layer));
        if (ops.size() == 2) {
            if (ops[1] != "Relu" && ops[1] != "LeakyRelu")
                Refuse(Describe(node) + " fuses " + ops[1] + "; the converter handles Relu and LeakyRelu");
            return Activation(name + "/" + ops[1], out, ops[1] == "Relu" ? 0.0 : AttrFloat(node, "leakyrelu_alpha", 0.2));
        }
        return out;
    }

    Tensor Activation(const std::string& name, const Tensor& x, double slope) {
        std::string params;
        if (slope != 0.0) params = "  relu_param {\n    negative_slope: " + FloatText(static_cast<float>(slope)) + "\n  }\n";
        m_layers.push_back(PlainLayer(name, "ReLU", {x.top}, params));
        Tensor out = x;
        out.top = name;
        out.biasFreeConv = -1;
        return out;
    }

    Tensor Add(const json& node, const std::vector<InputRef>& in, bool biasAdd) {
        if (in.size() != 2) Refuse(Describe(node) + " needs two inputs");
        const bool firstConst = Node(in[0].node).at("op").get<std::string>() == "Const";
        const bool secondConst = Node(in[1].node).at("op").get<std::string>() == "Const";
        if (firstConst && secondConst) Refuse(Describe(node) + " adds two constants");
        if (firstConst || secondConst) {
            Tensor x = TensorInput(node, in[firstConst ? 1 : 0]);
            RequireRank4(node, x);
            RequireNoPad(node, x);
            const Constant& bias = ConstantInput(node, in[firstConst ? 0 : 1]);
            // A per-channel constant: every dimension 1 but the one that
            // lines up with the channel axis.
            const int channels = x.shape[1];
            bool perChannel = !bias.isInt && bias.values.size() == static_cast<size_t>(channels);
            if (perChannel && !biasAdd) {
                const int rank = static_cast<int>(bias.shape.size());
                if (rank > 4) perChannel = false;
                for (int d = 0; d < rank && perChannel; ++d) {
                    const int graphAxis = 4 - rank + d;
                    if (x.layout[graphAxis] == 1) perChannel = bias.shape[d] == channels;
                    else perChannel = bias.shape[d] == 1;
                }
                if (rank == 0) perChannel = channels == 1;
            }
            if (perChannel && biasAdd && AttrString(node, "data_format", "NHWC") == "NHWC")
                perChannel = x.layout[3] == 1;
            else if (perChannel && biasAdd)
                perChannel = x.layout[1] == 1;
            if (!perChannel) Refuse(Describe(node) + " adds a constant that is not one value per channel");
            if (x.biasFreeConv < 0)
                Refuse(Describe(node) + " adds a constant to a tensor that is not the sole output of a convolution without bias");
            Layer& conv = m_layers[x.biasFreeConv];
            conv.hasBias = true;
            conv.blobs.push_back({{channels}, m_withWeights ? bias.values : std::vector<float>()});
            Tensor out = x;
            out.biasFreeConv = -1;
            return out;
        }
        Tensor a = TensorInput(node, in[0]);
        Tensor b = TensorInput(node, in[1]);
        RequireRank4(node, a);
        RequireRank4(node, b);
        RequireNoPad(node, a);
        RequireNoPad(node, b);
        if (a.layout != b.layout) Refuse(Describe(node) + " adds tensors held in different axis orders");
        if (a.shape != b.shape) Refuse(Describe(node) + " adds " + ShapeText(a.shape) + " to " + ShapeText(b.shape));
        const std::string name = node.at("name").get<std::string>();
        m_layers.push_back(PlainLayer(name, "Eltwise", {a.top, b.top}, "  eltwise_param {\n    operation: SUM\n  }\n"));
        Tensor out = a;
        out.top = name;
        out.biasFreeConv = -1;
        return out;
    }

    Tensor Pooling(const json& node, const std::vector<InputRef>& in, bool max) {
        Tensor x = TensorInput(node, in[0]);
        RequireRank4(node, x);
        if (x.padded && !max) Refuse(Describe(node) + " averages over a Pad, which the network format counts differently");
        if (x.padded && x.padValue > -FLT_MAX) Refuse(Describe(node) + " reads a Pad whose value is not -FLT_MAX or below");
        const bool channelsLast = AttrString(node, "data_format", "NHWC") == "NHWC";
        int kernel[2] = {1, 1}, stride[2] = {1, 1};
        SpatialPair(node, AttrInts(node, "ksize"), channelsLast, kernel, "window sizes");
        SpatialPair(node, AttrInts(node, "strides"), channelsLast, stride, "strides");
        const Window w = Geometry(node, x, kernel, stride, true);
        if (!max && (w.pad[0] || w.pad[1])) Refuse(Describe(node) + " averages with padding, which the network format counts differently");
        const std::string name = node.at("name").get<std::string>();
        std::ostringstream p;
        p << "  pooling_param {\n    pool: " << (max ? "MAX" : "AVE") << "\n    kernel_h: " << w.kernel[0]
          << "\n    kernel_w: " << w.kernel[1] << "\n    stride_h: " << w.stride[0] << "\n    stride_w: " << w.stride[1]
          << "\n    pad_h: " << w.pad[0] << "\n    pad_w: " << w.pad[1] << "\n  }\n";
        m_layers.push_back(PlainLayer(name, "Pooling", {x.top}, p.str()));
        Tensor out;
        out.top = name;
        out.layout = x.layout;
        out.shape = {{1, x.shape[1], w.out[0], w.out[1]}};
        return out;
    }

    Tensor Concat(const json& node, const std::vector<InputRef>& in) {
        if (in.size() < 2) Refuse(Describe(node) + " needs an axis");
        const Constant& axisConst = ConstantInput(node, in.back());
        if (!axisConst.isInt || axisConst.ints.size() != 1) Refuse(Describe(node) + " has an axis that is not one integer");
        std::vector<Tensor> parts;
        for (size_t i = 0; i + 1 < in.size(); ++i) {
            parts.push_back(TensorInput(node, in[i]));
            RequireRank4(node, parts.back());
            RequireNoPad(node, parts.back());
            if (parts.back().layout != parts.front().layout)
                Refuse(Describe(node) + " joins tensors held in different axis orders");
        }
        const int axis = BlobAxis(node, parts.front(), axisConst.ints[0]);
        Tensor out = parts.front();
        out.shape[axis] = 0;
        std::vector<std::string> bottoms;
        for (const Tensor& t : parts) {
            for (int d = 0; d < 4; ++d)
                if (d != axis && t.shape[d] != parts.front().shape[d])
                    Refuse(Describe(node) + " joins " + ShapeText(parts.front().shape) + " and " + ShapeText(t.shape));
            out.shape[axis] += t.shape[axis];
            bottoms.push_back(t.top);
        }
        const std::string name = node.at("name").get<std::string>();
        m_layers.push_back(PlainLayer(name, "Concat", bottoms, "  concat_param {\n    axis: " + std::to_string(axis) + "\n  }\n"));
        out.top = name;
        out.biasFreeConv = -1;
        return out;
    }

    Tensor Mean(const json& node, const std::vector<InputRef>& in) {
        if (in.size() != 2) Refuse(Describe(node) + " needs axes");
        Tensor x = TensorInput(node, in[0]);
        RequireRank4(node, x);
        RequireNoPad(node, x);
        const Constant& axes = ConstantInput(node, in[1]);
        std::set<int> blobAxes;
        if (axes.isInt)
            for (int64_t a : axes.ints) blobAxes.insert(BlobAxis(node, x, a));
        if (blobAxes != std::set<int>{2, 3}) Refuse(Describe(node) + " averages over other axes than height and width");
        const std::string name = node.at("name").get<std::string>();
        m_layers.push_back(PlainLayer(name, "Pooling", {x.top}, "  pooling_param {\n    pool: AVE\n    global_pooling: true\n  }\n"));
        Tensor out = x;
        out.top = name;
        out.shape[2] = out.shape[3] = 1;
        out.biasFreeConv = -1;
        if (!AttrBool(node, "keep_dims", false)) out.rank = 2;
        return out;
    }

    NetworkFiles Write() const {
        std::ostringstream text;
        text << "name: \"" << m_options.networkName << "\"\n";
        text << "layer {\n  name: \"data\"\n  type: \"MemoryData\"\n  top: \"data\"\n  top: \"label\"\n"
             << "  transform_param {\n    scale: 1\n    crop_size: " << m_options.crop << "\n";
        for (int c = 0; c < 3; ++c) {
            const int source = m_options.rgbInput ? 2 - c : c;  // blob channel c is B, G, R
            text << "    mean_value: " << FloatText(m_options.mean[source]) << "\n";
        }
        text << "  }\n  memory_data_param {\n    batch_size: 1\n    channels: 3\n    height: " << kNetworkInputSize
             << "\n    width: " << kNetworkInputSize << "\n  }\n}\n";
        NetworkFiles files;
        for (const Layer& layer : m_layers) {
            text << "layer {\n  name: \"" << layer.name << "\"\n  type: \"" << layer.type << "\"\n";
            for (const std::string& bottom : layer.bottoms) text << "  bottom: \"" << bottom << "\"\n";
            text << "  top: \"" << layer.top << "\"\n";
            if (layer.isConvolution) {
                text << "  convolution_param {\n    num_output: " << layer.outputs
                     << "\n    bias_term: " << (layer.hasBias ? "true" : "false") << "\n    kernel_h: " << layer.kernelH
                     << "\n    kernel_w: " << layer.kernelW << "\n    stride_h: " << layer.strideH
                     << "\n    stride_w: " << layer.strideW << "\n    pad_h: " << layer.padH << "\n    pad_w: " << layer.padW
                     << "\n    group: " << layer.group << "\n  }\n";
            } else {
                text << layer.params;
            }
            text << "}\n";
            if (!layer.blobs.empty()) files.weights.push_back({layer.name, layer.type, {}, {}, layer.blobs});
        }
        files.definition = text.str();
        files.name = m_options.networkName;
        return files;
    }

    const TfjsConversion& m_options;
    const std::map<std::string, const json*>& m_nodes;
    const std::map<std::string, Constant>& m_constants;
    const bool m_withWeights;
    std::map<std::string, Tensor> m_values;
    std::set<std::string> m_inProgress;
    std::map<std::string, int> m_consumers;
    std::vector<Layer> m_layers;
    bool m_inputSeen = false;
    bool m_sawInputConvolution = false;
};

}  // namespace

NetworkFiles ConvertTfjs(const TfjsConversion& options) {
    // The library draws the photo 227 pixels wide in the middle of its 256
    // canvas; a larger crop would take in the black border.
    if (options.crop < 1 || options.crop > kNetworkImageSize)
        Refuse("the crop must be 1 to " + std::to_string(kNetworkImageSize) + " pixels, the photo's side on the library's canvas");
    for (float s : options.std)
        if (!(s > 0.0f) || !std::isfinite(s)) Refuse("every std must be a positive number");
    const fs::path path(options.modelJson);
    json model;
    try {
        model = json::parse(ReadFileBytes(path));
    } catch (const json::exception& e) {
        Refuse(path.string() + " is not valid JSON: " + e.what());
    }
    try {
        if (!model.contains("modelTopology") || !model.at("modelTopology").contains("node"))
            Refuse(path.string() + " is not a graph model (no modelTopology.node)");
        std::map<std::string, const json*> nodes;
        for (const json& node : model.at("modelTopology").at("node")) nodes[node.at("name").get<std::string>()] = &node;
        const std::map<std::string, Constant> constants =
            ReadWeights(model.value("weightsManifest", json()), path.parent_path());

        InputRef feature = ParseInput(options.featureTensor);
        if (!nodes.count(feature.node)) Refuse("no tensor named " + options.featureTensor + " in " + path.string());
        if (feature.index != 0) Refuse("the feature must be output 0 of its node, not " + options.featureTensor);
        try {
            return Converter(options, nodes, constants, true).Run(feature.node);
        } catch (const CropError& e) {
            // Name the crops that would work, found by converting the
            // graph's geometry alone at each of them.
            std::string working;
            int found = 0;
            for (int crop = kNetworkImageSize; crop >= 32 && found < 4; --crop) {
                TfjsConversion trial = options;
                trial.crop = crop;
                try {
                    Converter(trial, nodes, constants, false).Run(feature.node);
                    working = std::to_string(crop) + (working.empty() ? "" : ", ") + working;
                    ++found;
                } catch (const ConversionError&) {
                }
            }
            Refuse(std::string(e.what()) + (working.empty() ? "; no crop from 32 to 227 works"
                                                           : "; crops that keep every size exact: ..., " + working));
        }
    } catch (const json::exception& e) {
        Refuse(path.string() + " is not a graph model this converter understands: " + e.what());
    }
}

}  // namespace modelkit
}  // namespace vora
