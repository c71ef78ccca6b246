#include "support/ModelFixtures.h"

#include <stdlib.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <random>
#include <sstream>
#include <stdexcept>

#include "model/FeatureNetwork.h"
#include "model/StyleDatabase.h"

namespace vora {
namespace fixtures {

namespace {

constexpr const char* kMeanFileName = "mean.binaryproto";
constexpr int kChannels = 3;

std::string FloatText(float value) {
    char text[32];
    std::snprintf(text, sizeof text, "%.9g", static_cast<double>(value));
    return text;
}

}  // namespace

// ---- Bytes and files ------------------------------------------------------

std::string Int32Bytes(const std::vector<int32_t>& values) {
    std::string bytes(values.size() * sizeof(int32_t), '\0');
    if (!values.empty()) std::memcpy(&bytes[0], values.data(), bytes.size());
    return bytes;
}

std::string FloatBytes(const std::vector<float>& values) {
    std::string bytes(values.size() * sizeof(float), '\0');
    if (!values.empty()) std::memcpy(&bytes[0], values.data(), bytes.size());
    return bytes;
}

void WriteBytes(const std::string& path, const std::string& bytes) {
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
    if (!file.flush()) throw std::runtime_error("cannot write " + path);
}

std::string ReadBytes(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    if (!file) throw std::runtime_error("cannot read " + path);
    std::ostringstream bytes;
    bytes << file.rdbuf();
    return bytes.str();
}

void TruncateFile(const std::string& path, size_t size) { std::filesystem::resize_file(path, size); }

// ---- The four data files ---------------------------------------------------

void WriteClusterFile(const std::string& path, const std::vector<ClusterCentre>& centres,
                      std::optional<int32_t> count) {
    std::string bytes = Int32Bytes({count.value_or(static_cast<int32_t>(centres.size()))});
    for (const ClusterCentre& centre : centres) bytes += FloatBytes(std::vector<float>(centre.begin(), centre.end()));
    WriteBytes(path, bytes);
}

void WriteStyleFile(const std::string& path, const std::vector<ColourStats>& styles, std::optional<int32_t> count) {
    std::string bytes = Int32Bytes({count.value_or(static_cast<int32_t>(styles.size()))});
    for (const ColourStats& style : styles) bytes += FloatBytes(std::vector<float>(style.data(), style.data() + 38));
    WriteBytes(path, bytes);
}

void WriteScoresFile(const std::string& path, const std::vector<std::vector<float>>& scores,
                     std::optional<int32_t> rows, std::optional<int32_t> columns, bool transposed) {
    const int32_t r = rows.value_or(static_cast<int32_t>(scores.size()));
    const int32_t c = columns.value_or(scores.empty() ? 0 : static_cast<int32_t>(scores[0].size()));
    std::vector<float> values;
    if (transposed) {
        const size_t width = scores.empty() ? 0 : scores[0].size();
        for (size_t col = 0; col < width; ++col)
            for (const std::vector<float>& row : scores) values.push_back(row.at(col));
    } else {
        for (const std::vector<float>& row : scores) values.insert(values.end(), row.begin(), row.end());
    }
    WriteBytes(path, Int32Bytes(transposed ? std::vector<int32_t>{c, r} : std::vector<int32_t>{r, c}) + FloatBytes(values));
}

void WriteDistanceFile(const std::string& path, int32_t count, const std::vector<float>& upperTriangle) {
    WriteBytes(path, Int32Bytes({count}) + FloatBytes(upperTriangle));
}

std::vector<float> UpperTriangle(const std::vector<std::vector<float>>& matrix) {
    std::vector<float> values;
    for (size_t i = 0; i < matrix.size(); ++i)
        for (size_t j = i; j < matrix[i].size(); ++j) values.push_back(matrix[i][j]);
    return values;
}

// ---- The fixture network ---------------------------------------------------

std::vector<float> DefaultWeights(int outputs) {
    std::vector<float> weights;
    for (int k = 0; k < outputs; ++k)
        for (int c = 0; c < kChannels; ++c) weights.push_back(static_cast<float>(std::sin(0.7 * k + 2.1 * c)));
    return weights;
}

std::vector<float> DefaultBias(int outputs) {
    std::vector<float> bias;
    for (int k = 0; k < outputs; ++k) bias.push_back(static_cast<float>(0.1 * std::cos(1.3 * k)));
    return bias;
}

cv::Mat FixtureMeanBlob(const NetworkOptions& options) {
    if (!options.meanBlob.empty()) return options.meanBlob;
    const int sizes[3] = {kChannels, options.height, options.width};
    cv::Mat mean(3, sizes, CV_32F);
    for (int c = 0; c < kChannels; ++c)
        for (int y = 0; y < options.height; ++y)
            for (int x = 0; x < options.width; ++x)
                mean.ptr<float>(c, y)[x] = 90.0f + static_cast<float>((37 * c + y + 2 * x) % 61) * 0.5f;
    return mean;
}

std::string FixtureDefinition(const NetworkOptions& options) {
    std::ostringstream text;
    text << "name: \"vora_fixture\"\n";
    if (options.memoryData) {
        text << "layer {\n  name: \"data\"\n  type: \"MemoryData\"\n  top: \"data\"\n  top: \"label\"\n"
             << "  memory_data_param {\n    batch_size: 1\n    channels: " << kChannels << "\n    height: "
             << options.height << "\n    width: " << options.width << "\n  }\n  transform_param {\n";
        if (options.cropSize > 0) text << "    crop_size: " << options.cropSize << "\n";
        if (options.meanFile) {
            text << "    mean_file: \"" << kMeanFileName << "\"\n";
        } else {
            for (float mean : options.meanValues) text << "    mean_value: " << FloatText(mean) << "\n";
        }
        if (options.writeScale) text << "    scale: " << FloatText(options.scale) << "\n";
        text << "  }\n}\n";
    } else {
        text << "input: \"data\"\ninput_shape {\n  dim: 1\n  dim: " << kChannels << "\n  dim: " << options.height
             << "\n  dim: " << options.width << "\n}\n";
    }
    text << "layer {\n  name: \"pool\"\n  type: \"Pooling\"\n  bottom: \"data\"\n  top: \"pool\"\n"
         << "  pooling_param {\n    pool: AVE\n    global_pooling: true\n  }\n}\n"
         << "layer {\n  name: \"fc512\"\n  type: \"InnerProduct\"\n  bottom: \"pool\"\n  top: \"fc512\"\n"
         << "  inner_product_param {\n    num_output: " << options.outputs << "\n  }\n}\n";
    if (options.reluOnOutput)
        text << "layer {\n  name: \"relu\"\n  type: \"ReLU\"\n  bottom: \"fc512\"\n  top: \"fc512\"\n}\n";
    return text.str();
}

std::vector<WeightsLayer> FixtureWeights(const NetworkOptions& options) {
    WeightsLayer fc;
    fc.name = "fc512";
    fc.type = "InnerProduct";
    fc.bottoms = {"pool"};
    fc.tops = {"fc512"};
    WeightsBlob weights;
    weights.shape = {options.outputs, kChannels};
    weights.data = options.weights.empty() ? DefaultWeights(options.outputs) : options.weights;
    WeightsBlob bias;
    bias.shape = {options.outputs};
    bias.data = options.bias.empty() ? DefaultBias(options.outputs) : options.bias;
    fc.blobs = {weights, bias};
    return {fc};
}

void WriteNetworkFiles(const std::string& folder, const std::string& definition,
                       const std::vector<WeightsLayer>& weights) {
    std::filesystem::create_directories(folder);
    WriteBytes(folder + kNetworkDefinitionName, definition);
    if (!WriteWeightsFile(folder + kNetworkWeightsName, "vora_fixture", weights))
        throw std::runtime_error("cannot write the fixture weights in " + folder);
}

void WriteFixtureNetwork(const std::string& folder, const NetworkOptions& options) {
    using Files = NetworkOptions::Files;
    if (options.files == Files::None) return;
    WriteNetworkFiles(folder, FixtureDefinition(options), FixtureWeights(options));
    if (options.meanFile) {
        const cv::Mat mean = FixtureMeanBlob(options);
        WeightsBlob blob;
        blob.shape = {1, kChannels, options.height, options.width};
        blob.data.assign(mean.ptr<float>(), mean.ptr<float>() + mean.total());
        WriteBytes(folder + kMeanFileName, SerializeBlob(blob));
    }
    switch (options.files) {
        case Files::MissingDefinition: std::filesystem::remove(folder + kNetworkDefinitionName); break;
        case Files::MissingWeights: std::filesystem::remove(folder + kNetworkWeightsName); break;
        case Files::GarbledDefinition:
            WriteBytes(folder + kNetworkDefinitionName, "name: \"broken\"\nlayer {\n  name: \"data\"\n  type: {{\n");
            break;
        case Files::GarbledWeights:
            // A length-delimited field claiming far more bytes than follow.
            WriteBytes(folder + kNetworkWeightsName, std::string("\x0a\xff\xff\xff\x0f", 5) + "garbage");
            break;
        default: break;
    }
}

namespace {

// Per-channel average of the values the network's first layer receives.
std::vector<double> PooledInput(const NetworkOptions& options, const cv::Mat& bgr8) {
    if (bgr8.type() != CV_8UC3) throw std::invalid_argument("ExpectedFeature needs an 8-bit, 3-channel image");
    int top = 0;
    int left = 0;
    int rows = bgr8.rows;
    int cols = bgr8.cols;
    if (options.memoryData && options.cropSize > 0) {
        top = (bgr8.rows - options.cropSize) / 2;
        left = (bgr8.cols - options.cropSize) / 2;
        rows = cols = options.cropSize;
    }
    const cv::Mat meanBlob = options.memoryData && options.meanFile ? FixtureMeanBlob(options) : cv::Mat();
    std::vector<double> sums(kChannels, 0.0);
    for (int y = top; y < top + rows; ++y) {
        for (int x = left; x < left + cols; ++x) {
            const cv::Vec3b pixel = bgr8.at<cv::Vec3b>(y, x);
            for (int c = 0; c < kChannels; ++c) {
                float value = static_cast<float>(pixel[c]);
                if (options.memoryData) {
                    float mean = 0.0f;
                    if (!meanBlob.empty())
                        mean = meanBlob.ptr<float>(c, y)[x];
                    else if (options.meanValues.size() == 1)
                        mean = options.meanValues[0];
                    else if (options.meanValues.size() == kChannels)
                        mean = options.meanValues[static_cast<size_t>(c)];
                    value = (value - mean) * (options.writeScale ? options.scale : 1.0f);
                }
                sums[static_cast<size_t>(c)] += value;
            }
        }
    }
    for (double& sum : sums) sum /= static_cast<double>(rows) * cols;
    return sums;
}

std::vector<float> FullyConnected(const NetworkOptions& options, const std::vector<double>& input) {
    const std::vector<float> weights = options.weights.empty() ? DefaultWeights(options.outputs) : options.weights;
    const std::vector<float> bias = options.bias.empty() ? DefaultBias(options.outputs) : options.bias;
    std::vector<float> feature(static_cast<size_t>(options.outputs));
    for (size_t k = 0; k < feature.size(); ++k) {
        double value = bias[k];
        for (size_t c = 0; c < kChannels; ++c) value += static_cast<double>(weights[k * kChannels + c]) * input[c];
        if (options.reluOnOutput) value = std::max(value, 0.0);
        feature[k] = static_cast<float>(value);
    }
    return feature;
}

}  // namespace

std::vector<float> ExpectedFeature(const NetworkOptions& options, const cv::Mat& bgr8) {
    return FullyConnected(options, PooledInput(options, bgr8));
}

std::vector<float> ExpectedFeatureForColour(const NetworkOptions& options, const cv::Vec3b& bgr) {
    const cv::Mat image(options.height, options.width, CV_8UC3, cv::Scalar(bgr[0], bgr[1], bgr[2]));
    return ExpectedFeature(options, image);
}

ClusterCentre CentreFromFeature(const std::vector<float>& feature) {
    ClusterCentre centre{};
    std::copy_n(feature.begin(), std::min(feature.size(), centre.size()), centre.begin());
    return centre;
}

// ---- Whole model directories -----------------------------------------------

FixtureOptions RandomDatabase(int clusters, int styles, uint32_t seed) {
    std::mt19937 random(seed);
    std::uniform_real_distribution<float> unit(0.0f, 1.0f);
    FixtureOptions options;

    options.centres.resize(static_cast<size_t>(clusters));
    for (ClusterCentre& centre : options.centres)
        for (float& value : centre) value = unit(random) * 4.0f - 2.0f;

    options.styles.resize(static_cast<size_t>(styles));
    for (ColourStats& style : options.styles) {
        style = ColourStats{};
        style.chromaMean[0] = unit(random) * 40.0f - 20.0f;
        style.chromaMean[1] = unit(random) * 40.0f - 20.0f;
        const float offDiagonal = unit(random) * 2.0f - 1.0f;
        style.chromaSqrtCov[0] = 2.0f + unit(random) * 8.0f;
        style.chromaSqrtCov[1] = offDiagonal;
        style.chromaSqrtCov[2] = offDiagonal;
        style.chromaSqrtCov[3] = 2.0f + unit(random) * 8.0f;
        for (float& sample : style.lightness) sample = unit(random);
        std::sort(std::begin(style.lightness), std::end(style.lightness));
    }

    options.scores.assign(static_cast<size_t>(clusters), std::vector<float>(static_cast<size_t>(styles)));
    for (std::vector<float>& row : options.scores)
        for (float& score : row) score = unit(random);

    options.distances.assign(static_cast<size_t>(styles), std::vector<float>(static_cast<size_t>(styles), 0.0f));
    for (size_t i = 0; i < options.distances.size(); ++i)
        for (size_t j = i + 1; j < options.distances.size(); ++j)
            options.distances[i][j] = options.distances[j][i] = unit(random) * 100.0f;
    return options;
}

std::string MakeTempFolder() {
    std::string pattern = (std::filesystem::temp_directory_path() / "vora-fixture-XXXXXX").string();
    if (mkdtemp(&pattern[0]) == nullptr) throw std::runtime_error("cannot make a temporary folder");
    return pattern;
}

void RemoveTree(const std::string& path) {
    std::error_code ignored;
    std::filesystem::remove_all(path, ignored);
}

ModelFixture::ModelFixture(const FixtureOptions& options) : m_root(MakeTempFolder()), m_options(options) {
    try {
        const std::string dataFolder = m_root + (options.trailingSeparator ? "/model/" : "/m/");
        m_modelDir = options.trailingSeparator ? dataFolder : m_root + "/m";
        std::filesystem::create_directories(dataFolder);

        if (options.writeClusters) WriteClusterFile(DataFile(kClusterFileName), options.centres, options.clusterCount);
        if (options.writeStyles) WriteStyleFile(DataFile(kStyleFileName), options.styles, options.styleCount);
        if (options.writeScores)
            WriteScoresFile(DataFile(kScoresFileName), options.scores, options.scoreRows,
                            options.scoreColumns.value_or(static_cast<int32_t>(
                                options.scores.empty() ? options.styles.size() : options.scores[0].size())),
                            options.transposeScores);
        if (options.writeDistances)
            WriteDistanceFile(DataFile(kDistanceFileName),
                              options.distanceCount.value_or(static_cast<int32_t>(options.distances.size())),
                              UpperTriangle(options.distances));
        WriteFixtureNetwork(m_modelDir + kNetworkFolder, options.network);
    } catch (...) {
        RemoveTree(m_root);
        throw;
    }
}

ModelFixture::ModelFixture(ModelFixture&& other) noexcept
    : m_root(std::move(other.m_root)), m_modelDir(std::move(other.m_modelDir)), m_options(std::move(other.m_options)) {
    other.m_root.clear();
}

ModelFixture::~ModelFixture() {
    if (!m_root.empty()) RemoveTree(m_root);
}

std::string ModelFixture::DataFile(const char* name) const { return DataFilePath(m_modelDir, name); }

std::string ModelFixture::NetworkFile(const char* name) const { return m_modelDir + kNetworkFolder + name; }

}  // namespace fixtures
}  // namespace vora
