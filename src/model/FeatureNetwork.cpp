#include "model/FeatureNetwork.h"

#include <cctype>
#include <cerrno>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <limits>
#include <locale>
#include <map>
#include <set>
#include <sstream>

#include "model/ProtoText.h"

namespace vora {

const char* const kNetworkFolder = "net/";
const char* const kNetworkDefinitionName = "deploy2.prototxt";
const char* const kNetworkWeightsName = "caffe_reduce_512_model";

namespace {

using prototext::Field;
using prototext::Message;

[[noreturn]] void Refuse(const std::string& what) {
    CV_Error(cv::Error::StsBadArg, "network definition: " + what);
}

bool ReadWholeFile(const std::string& path, std::string& bytes) {
    std::ifstream file(path, std::ios::binary);
    if (!file) return false;
    std::ostringstream buffer;
    buffer << file.rdbuf();
    if (file.bad()) return false;
    bytes = buffer.str();
    return true;
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

bool IsLayerField(const Field& field) {
    return field.isMessage && (field.name == "layer" || field.name == "layers");
}

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

bool IsMemoryData(const Message& layer) {
    const std::string type = layer.Scalar("type");
    return type == "MemoryData" || type == "MEMORY_DATA" || type == "29";  // the last two: old layer format
}

// Fills the transform from the layer and returns the replacement fields.
std::vector<Field> ReplaceMemoryData(const Message& layer, PreparedDefinition& prepared) {
    const std::string context = "MemoryData layer '" + layer.Scalar("name") + "'";
    const std::vector<std::string> tops = layer.Scalars("top");
    if (tops.empty()) Refuse(context + " has no top");

    const Field* params = layer.First("memory_data_param");
    if (params == nullptr || !params->isMessage) Refuse(context + " has no memory_data_param");
    InputTransform& transform = prepared.transform;
    transform.channels = PositiveInt(params->message, "channels", "memory_data_param");
    transform.height = PositiveInt(params->message, "height", "memory_data_param");
    transform.width = PositiveInt(params->message, "width", "memory_data_param");

    const Field* transformField = layer.First("transform_param");
    if (transformField != nullptr && transformField->isMessage) {
        const Message& t = transformField->message;
        const Field* crop = t.First("crop_size");
        if (crop != nullptr) {
            const int64_t size = ParseInteger(crop->value, "crop_size");
            if (size < 0 || size > transform.height || size > transform.width)
                Refuse("crop_size " + crop->value + " does not fit the " + std::to_string(transform.height) + " x " +
                       std::to_string(transform.width) + " input");
            transform.cropSize = static_cast<int>(size);
        }
        const Field* scale = t.First("scale");
        if (scale != nullptr) transform.scale = ParseFloat(scale->value, "scale");
        for (const std::string& mean : t.Scalars("mean_value")) transform.meanValues.push_back(ParseFloat(mean, "mean_value"));
        const size_t means = transform.meanValues.size();
        if (means > 1 && means != static_cast<size_t>(transform.channels))
            Refuse(std::to_string(means) + " mean_value entries for " + std::to_string(transform.channels) +
                   " channels (give one, or one per channel)");
        prepared.meanFile = t.Scalar("mean_file");
        if (!prepared.meanFile.empty() && means > 0) Refuse("mean_file and mean_value cannot both be given");
        // mirror only matters while training; it is ignored here.
    }

    prepared.memoryData = true;
    prepared.inputName = tops[0];  // the label top is dropped

    Message shape;
    const int dims[4] = {1, transform.channels, transform.OutputHeight(), transform.OutputWidth()};
    for (int dim : dims) shape.fields.push_back(Field::MakeScalar("dim", std::to_string(dim), false));
    return {Field::MakeScalar("input", tops[0], true), Field::MakeMessage("input_shape", shape)};
}

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

// Varint and fixed-width fields of the weights format, for the mean blob.
class WireReader {
public:
    WireReader(const uint8_t* data, size_t size) : m_data(data), m_end(data + size) {}
    bool AtEnd() const { return m_data >= m_end; }

    uint64_t Varint() {
        uint64_t value = 0;
        for (int shift = 0; shift < 64; shift += 7) {
            Need(1);
            const uint8_t byte = *m_data++;
            value |= static_cast<uint64_t>(byte & 0x7F) << shift;
            if ((byte & 0x80) == 0) return value;
        }
        Bad("overlong varint");
    }

    template <typename T>
    T Fixed() {
        Need(sizeof(T));
        T value;
        std::memcpy(&value, m_data, sizeof(T));  // little-endian, as this machine
        m_data += sizeof(T);
        return value;
    }

    WireReader Sub() {
        const uint64_t length = Varint();
        Need(length);
        WireReader sub(m_data, static_cast<size_t>(length));
        m_data += length;
        return sub;
    }

    void Skip(int wireType) {
        switch (wireType) {
            case 0: Varint(); break;
            case 1: Need(8); m_data += 8; break;
            case 2: Sub(); break;
            case 5: Need(4); m_data += 4; break;
            default: Bad("unsupported wire type " + std::to_string(wireType));
        }
    }

    [[noreturn]] static void Bad(const std::string& what) {
        CV_Error(cv::Error::StsParseError, "mean file: " + what);
    }

private:
    void Need(uint64_t bytes) const {
        if (bytes > static_cast<uint64_t>(m_end - m_data)) Bad("truncated");
    }

    const uint8_t* m_data;
    const uint8_t* m_end;
};

// Repeated numeric field, packed (wire type 2) or one value per key.
template <typename T, typename Read>
void ReadRepeated(WireReader& reader, int wireType, int scalarWireType, std::vector<T>& out, Read read) {
    if (wireType == 2) {
        WireReader packed = reader.Sub();
        while (!packed.AtEnd()) out.push_back(read(packed));
    } else if (wireType == scalarWireType) {
        out.push_back(read(reader));
    } else {
        reader.Skip(wireType);
    }
}

std::string Dirname(const std::string& path) {
    const size_t slash = path.find_last_of('/');
    return slash == std::string::npos ? std::string() : path.substr(0, slash + 1);
}

}  // namespace

cv::Mat ApplyInputTransform(const InputTransform& transform, const cv::Mat& image8) {
    CV_CheckDepthEQ(image8.depth(), CV_8U, "the network input must be 8-bit");
    CV_CheckEQ(image8.channels(), transform.channels, "the network input has the wrong channel count");
    const int channels = transform.channels;
    int outRows = image8.rows;
    int outCols = image8.cols;
    int top = 0;
    int left = 0;
    if (transform.cropSize > 0) {
        CV_CheckGE(image8.rows, transform.cropSize, "the network input is smaller than the crop");
        CV_CheckGE(image8.cols, transform.cropSize, "the network input is smaller than the crop");
        outRows = outCols = transform.cropSize;
        top = (image8.rows - transform.cropSize) / 2;
        left = (image8.cols - transform.cropSize) / 2;
    } else if (transform.height > 0 && transform.width > 0) {
        CV_CheckEQ(image8.rows, transform.height, "the network input has the wrong height");
        CV_CheckEQ(image8.cols, transform.width, "the network input has the wrong width");
    }
    const bool meanBlob = !transform.meanBlob.empty();
    if (meanBlob) {
        CV_CheckEQ(transform.meanBlob.dims, 3, "the mean blob must be channels x height x width");
        CV_CheckTypeEQ(transform.meanBlob.type(), CV_32F, "the mean blob must be float");
        CV_CheckEQ(transform.meanBlob.size[0], channels, "the mean blob has the wrong channel count");
        CV_CheckEQ(transform.meanBlob.size[1], image8.rows, "the mean blob and the input differ in height");
        CV_CheckEQ(transform.meanBlob.size[2], image8.cols, "the mean blob and the input differ in width");
    }
    const size_t means = transform.meanValues.size();
    CV_Check(means, means <= 1 || means == static_cast<size_t>(channels), "one mean value, or one per channel");

    const int shape[4] = {1, channels, outRows, outCols};
    cv::Mat blob(4, shape, CV_32F);
    float* out = blob.ptr<float>();
    for (int c = 0; c < channels; ++c) {
        const float meanValue = means == 0 ? 0.0f : transform.meanValues[means == 1 ? 0 : static_cast<size_t>(c)];
        for (int y = 0; y < outRows; ++y) {
            const uint8_t* in = image8.ptr<uint8_t>(top + y) + static_cast<size_t>(left) * channels + c;
            const float* meanRow = meanBlob ? transform.meanBlob.ptr<float>(c, top + y) + left : nullptr;
            for (int x = 0; x < outCols; ++x, in += channels) {
                const float mean = meanBlob ? meanRow[x] : meanValue;
                *out++ = (static_cast<float>(*in) - mean) * transform.scale;
            }
        }
    }
    return blob;
}

PreparedDefinition PrepareDefinition(const std::string& definitionText) {
    const Message original = prototext::Parse(definitionText);
    PreparedDefinition prepared;
    Message net;
    bool firstLayer = true;
    for (const Field& field : original.fields) {
        if (!IsLayerField(field)) {
            net.fields.push_back(field);
            continue;
        }
        // Layers a network built for testing leaves out are dropped here, so
        // that neither the first-layer test nor the dnn module sees them.
        if (!KeptInTestPhase(field.message)) continue;
        if (firstLayer && IsMemoryData(field.message)) {
            for (Field& replacement : ReplaceMemoryData(field.message, prepared)) net.fields.push_back(replacement);
        } else {
            net.fields.push_back(field);
        }
        firstLayer = false;
    }

    if (!prepared.memoryData) {
        const std::vector<std::string> inputs = net.Scalars("input");
        if (!inputs.empty()) {
            prepared.inputName = inputs[0];
        } else {
            for (const Field& field : net.fields) {
                if (IsLayerField(field) && field.message.Scalar("type") == "Input") {
                    prepared.inputName = field.message.Scalar("top");
                    break;
                }
            }
        }
    }
    FindOutput(net, prepared);
    prepared.text = prototext::Write(net);
    return prepared;
}

cv::Mat ReadMeanBlob(const std::string& path, int channels, int height, int width) {
    std::string bytes;
    if (!ReadWholeFile(path, bytes)) CV_Error(cv::Error::StsError, "cannot read the mean file " + path);

    int64_t legacy[4] = {0, 0, 0, 0};  // num, channels, height, width
    bool hasLegacy = false;
    std::vector<int64_t> shape;
    std::vector<float> data;
    std::vector<double> doubleData;
    WireReader reader(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size());
    while (!reader.AtEnd()) {
        const uint64_t key = reader.Varint();
        const int field = static_cast<int>(key >> 3);
        const int wireType = static_cast<int>(key & 7);
        if (field >= 1 && field <= 4 && wireType == 0) {
            legacy[field - 1] = static_cast<int32_t>(reader.Varint());
            hasLegacy = true;
        } else if (field == 5) {
            ReadRepeated(reader, wireType, 5, data, [](WireReader& r) { return r.Fixed<float>(); });
        } else if (field == 8) {
            ReadRepeated(reader, wireType, 1, doubleData, [](WireReader& r) { return r.Fixed<double>(); });
        } else if (field == 7 && wireType == 2) {
            WireReader shapeReader = reader.Sub();
            while (!shapeReader.AtEnd()) {
                const uint64_t shapeKey = shapeReader.Varint();
                if ((shapeKey >> 3) == 1)
                    ReadRepeated(shapeReader, static_cast<int>(shapeKey & 7), 0, shape,
                                 [](WireReader& r) { return static_cast<int64_t>(r.Varint()); });
                else
                    shapeReader.Skip(static_cast<int>(shapeKey & 7));
            }
        } else {
            reader.Skip(wireType);
        }
    }

    // The legacy fields win when present, as in the original reader; a shape
    // of fewer than four axes is read with 1 for the missing trailing axes.
    int64_t dims[4] = {1, 1, 1, 1};
    if (hasLegacy) {
        for (int i = 0; i < 4; ++i) dims[i] = legacy[i];
    } else {
        if (shape.size() > 4) WireReader::Bad("more than four axes");
        for (size_t i = 0; i < shape.size(); ++i) dims[i] = shape[i];
    }
    if (dims[1] != channels || dims[2] != height || dims[3] != width)
        CV_Error(cv::Error::StsBadSize, "mean file " + path + " is " + std::to_string(dims[1]) + " x " +
                                            std::to_string(dims[2]) + " x " + std::to_string(dims[3]) + ", the input is " +
                                            std::to_string(channels) + " x " + std::to_string(height) + " x " +
                                            std::to_string(width));
    const size_t wanted = static_cast<size_t>(channels) * static_cast<size_t>(height) * static_cast<size_t>(width);
    if (data.empty())
        for (double value : doubleData) data.push_back(static_cast<float>(value));
    if (dims[0] < 1 || data.size() != wanted * static_cast<size_t>(dims[0]))
        CV_Error(cv::Error::StsBadSize, "mean file " + path + " holds " + std::to_string(data.size()) +
                                            " values for its shape");

    const int sizes[3] = {channels, height, width};
    cv::Mat mean(3, sizes, CV_32F);
    std::memcpy(mean.ptr<float>(), data.data(), wanted * sizeof(float));  // the first image only
    return mean;
}

std::unique_ptr<FeatureNetwork> FeatureNetwork::Load(const std::string& definitionPath,
                                                     const std::string& weightsPath) {
    std::string definition;
    std::string weights;
    if (!ReadWholeFile(definitionPath, definition) || !ReadWholeFile(weightsPath, weights)) {
        // Let the dnn module report the missing file in its own words.
        cv::dnn::readNetFromCaffe(definitionPath, weightsPath);
        CV_Error(cv::Error::StsError, "cannot read the network files " + definitionPath + " and " + weightsPath);
    }

    const PreparedDefinition prepared = PrepareDefinition(definition);
    std::unique_ptr<FeatureNetwork> network(new FeatureNetwork());
    network->m_transform = prepared.transform;
    network->m_memoryData = prepared.memoryData;
    network->m_inputName = prepared.inputName;
    network->m_outputName = prepared.outputTop;
    network->m_outputLayer = prepared.outputLayer;
    network->m_outputIndex = prepared.outputIndex;
    if (!prepared.meanFile.empty()) {
        const std::string meanPath =
            prepared.meanFile[0] == '/' ? prepared.meanFile : Dirname(definitionPath) + prepared.meanFile;
        network->m_transform.meanBlob =
            ReadMeanBlob(meanPath, prepared.transform.channels, prepared.transform.height, prepared.transform.width);
    }

    network->m_net = cv::dnn::readNetFromCaffe(prepared.text.data(), prepared.text.size(), weights.data(), weights.size());
    network->m_net.setPreferableBackend(cv::dnn::DNN_BACKEND_OPENCV);
    network->m_net.setPreferableTarget(cv::dnn::DNN_TARGET_CPU);
    if (network->m_net.getLayerId(prepared.outputLayer) < 0)
        CV_Error(cv::Error::StsError, "the network has no layer '" + prepared.outputLayer + "' for its output '" +
                                          prepared.outputTop + "'");
    return network;
}

std::vector<float> FeatureNetwork::Forward(const cv::Mat& image8) {
    cv::Mat blob;
    if (m_memoryData) {
        blob = ApplyInputTransform(m_transform, image8);
    } else {
        InputTransform plain;
        plain.channels = image8.channels();
        blob = ApplyInputTransform(plain, image8);
    }
    m_net.setInput(blob, m_inputName);
    std::vector<cv::Mat> outputs;
    m_net.forward(outputs, m_outputLayer);
    CV_CheckLT(m_outputIndex, static_cast<int>(outputs.size()), "the output layer gave too few outputs");
    cv::Mat output = outputs[static_cast<size_t>(m_outputIndex)];
    CV_CheckTypeEQ(output.type(), CV_32F, "the network output must be float");
    if (!output.isContinuous()) output = output.clone();
    const float* values = output.ptr<float>();
    return std::vector<float>(values, values + output.total());
}

}  // namespace vora
