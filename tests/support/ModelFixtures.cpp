#include "support/ModelFixtures.h"

#include <stdlib.h>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <iomanip>
#include <random>
#include <sstream>
#include <stdexcept>
#include <utility>

#include "model/FeatureNetwork.h"
#include "model/StyleDatabase.h"

namespace vora {
namespace fixtures {

namespace {

constexpr int kSize = 256;  // the fixture network's input height and width, as its definition states

float Weight(int k, int c) { return static_cast<float>(std::sin(0.7 * k + 2.1 * c)); }
float Bias(int k) { return static_cast<float>(0.1 * std::cos(1.3 * k)); }

std::string FixtureDefinition(const NetworkOptions& o) {
    std::ostringstream text;
    text << std::setprecision(9) << "name: \"vora_fixture\"\n";
    if (o.memoryData) {
        text << R"(layer { name: "data" type: "MemoryData" top: "data" top: "label")"
             << " memory_data_param { batch_size: 1 channels: 3 height: 256 width: 256 } transform_param {";
        if (o.cropSize > 0) text << " crop_size: " << o.cropSize;
        if (o.meanFile) text << R"( mean_file: "mean.binaryproto")";
        for (float mean : o.meanFile ? std::vector<float>() : o.meanValues) text << " mean_value: " << mean;
        if (o.writeScale) text << " scale: " << o.scale;
        text << " } }\n";
    } else {
        text << R"(input: "data" input_shape { dim: 1 dim: 3 dim: 256 dim: 256 })" << "\n";
    }
    text << R"(layer { name: "pool" type: "Pooling" bottom: "data" top: "pool")"
         << " pooling_param { pool: AVE global_pooling: true } }\n"
         << R"(layer { name: "fc512" type: "InnerProduct" bottom: "pool" top: "fc512")"
         << " inner_product_param { num_output: " << o.outputs << " } }\n";
    return text.str();
}

}  // namespace

void WriteBytes(const std::string& path, const std::string& bytes) {
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
    if (!file.flush()) throw std::runtime_error("cannot write " + path);
}

std::string ReadBytes(const std::string& path) {
    std::ostringstream bytes;
    bytes << std::ifstream(path, std::ios::binary).rdbuf();  // a folder reads as empty
    return bytes.str();
}

void TruncateFile(const std::string& path, size_t size) { std::filesystem::resize_file(path, size); }

void WriteDataFile(const std::string& path, const std::vector<int32_t>& header, const std::vector<float>& values) {
    std::string bytes(reinterpret_cast<const char*>(header.data()), header.size() * sizeof(int32_t));
    bytes.append(reinterpret_cast<const char*>(values.data()), values.size() * sizeof(float));
    WriteBytes(path, bytes);
}

cv::Mat RandomMean(int height, int width) {
    const int sizes[3] = {3, height, width};
    cv::Mat mean(3, sizes, CV_32F);
    cv::RNG(static_cast<uint64_t>(height * 4096 + width)).fill(mean, cv::RNG::UNIFORM, 90.0f, 120.0f);
    return mean;
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
    WeightsBlob weights{{options.outputs, 3}, {}}, bias{{options.outputs}, {}};
    for (int k = 0; k < options.outputs; ++k) {
        for (int c = 0; c < 3; ++c) weights.data.push_back(Weight(k, c));
        bias.data.push_back(Bias(k));
    }
    WriteNetworkFiles(folder, FixtureDefinition(options),
                      {{"fc512", "InnerProduct", {"pool"}, {"fc512"}, {weights, bias}}});
    if (options.meanFile) {
        const cv::Mat mean = RandomMean(kSize, kSize);
        WriteBytes(folder + "mean.binaryproto",
                   SerializeBlob({{1, 3, kSize, kSize}, {mean.begin<float>(), mean.end<float>()}}));
    }
    if (options.files == Files::MissingWeights || options.files == Files::WeightsFolder)
        std::filesystem::remove(folder + kNetworkWeightsName);
    if (options.files == Files::WeightsFolder) std::filesystem::create_directory(folder + kNetworkWeightsName);
    if (options.files == Files::EmptyWeights) WriteBytes(folder + kNetworkWeightsName, "");
    if (options.files == Files::GarbledDefinition) WriteBytes(folder + kNetworkDefinitionName, "layer {\n  type: {{\n");
    if (options.files == Files::GarbledWeights)  // a length-delimited field claiming far more bytes than follow
        WriteBytes(folder + kNetworkWeightsName, std::string("\x0a\xff\xff\xff\x0f", 5) + "garbage");
}

cv::Mat HandInputBlob(const cv::Mat& bgr8, const InputTransform& t) {
    const int rows = t.cropSize > 0 ? t.cropSize : bgr8.rows, cols = t.cropSize > 0 ? t.cropSize : bgr8.cols;
    const int top = (bgr8.rows - rows) / 2, left = (bgr8.cols - cols) / 2;
    const int shape[4] = {1, 3, rows, cols};
    cv::Mat blob(4, shape, CV_32F);
    const std::vector<float>& means = t.meanValues;
    for (int c = 0; c < 3; ++c)
        for (int y = 0; y < rows; ++y)
            for (int x = 0; x < cols; ++x) {
                float mean = means.empty() ? 0.0f : means[means.size() == 1 ? 0 : static_cast<size_t>(c)];
                if (!t.meanBlob.empty()) mean = t.meanBlob.ptr<float>(c, top + y)[left + x];
                blob.ptr<float>(0, c, y)[x] = (bgr8.at<cv::Vec3b>(top + y, left + x)[c] - mean) * t.scale;
            }
    return blob;
}

std::vector<float> ExpectedFeature(const NetworkOptions& o, const cv::Mat& bgr8) {
    InputTransform transform;  // a plain input: the raw pixel values
    if (o.memoryData)
        transform = {3, kSize, kSize, o.cropSize, o.writeScale ? o.scale : 1.0f,
                     o.meanFile ? std::vector<float>() : o.meanValues,
                     o.meanFile ? RandomMean(kSize, kSize) : cv::Mat()};
    cv::Mat pooled;
    cv::reduce(HandInputBlob(bgr8, transform).reshape(1, 3), pooled, 1, cv::REDUCE_AVG, CV_64F);
    std::vector<float> feature;
    for (int k = 0; k < o.outputs; ++k) {
        double value = Bias(k);
        for (int c = 0; c < 3; ++c) value += static_cast<double>(Weight(k, c)) * pooled.at<double>(c);
        feature.push_back(static_cast<float>(value));
    }
    return feature;
}

FixtureOptions RandomDatabase(int clusters, int styles, uint32_t seed) {
    std::mt19937 random(seed);
    std::uniform_real_distribution<float> unit(0.0f, 1.0f);
    const size_t c = static_cast<size_t>(clusters), s = static_cast<size_t>(styles);
    FixtureOptions options;
    options.centres.resize(c);
    for (ClusterCentre& centre : options.centres)
        for (float& value : centre) value = unit(random) * 4.0f - 2.0f;
    options.styles.resize(s);
    for (ColourStats& style : options.styles) {
        for (float& mean : style.chromaMean) mean = unit(random) * 40.0f - 20.0f;
        style.chromaSqrtCov[0] = 2.0f + unit(random) * 8.0f;
        style.chromaSqrtCov[1] = style.chromaSqrtCov[2] = unit(random) * 2.0f - 1.0f;
        style.chromaSqrtCov[3] = 2.0f + unit(random) * 8.0f;
        for (float& sample : style.lightness) sample = unit(random);
        std::sort(std::begin(style.lightness), std::end(style.lightness));
    }
    options.scores.assign(c, std::vector<float>(s));
    for (std::vector<float>& row : options.scores)
        for (float& score : row) score = unit(random);
    options.distances.assign(s, std::vector<float>(s, 0.0f));
    for (size_t i = 0; i < s; ++i)
        for (size_t j = i + 1; j < s; ++j) options.distances[i][j] = options.distances[j][i] = unit(random) * 100.0f;
    return options;
}

TempFolder::TempFolder() : m_path((std::filesystem::temp_directory_path() / "vora-fixture-XXXXXX").string()) {
    if (mkdtemp(&m_path[0]) == nullptr) throw std::runtime_error("cannot make a temporary folder");
}

TempFolder::~TempFolder() {
    std::error_code ignored;
    std::filesystem::remove_all(m_path, ignored);
}

ModelFixture::ModelFixture(const FixtureOptions& o) {
    std::filesystem::create_directories(m_modelDir);
    const auto count = [](std::optional<int32_t> c, size_t n) { return c.value_or(static_cast<int32_t>(n)); };
    std::vector<float> centres, styles, scores, distances;
    for (const ClusterCentre& centre : o.centres) centres.insert(centres.end(), centre.begin(), centre.end());
    for (const ColourStats& style : o.styles) styles.insert(styles.end(), style.data(), style.data() + 38);
    const size_t rows = o.scores.size(), columns = rows ? o.scores[0].size() : o.styles.size();
    for (size_t i = 0; i < rows * columns; ++i)
        scores.push_back(o.transposeScores ? o.scores[i % rows][i / rows] : o.scores[i / columns][i % columns]);
    for (size_t i = 0; i < o.distances.size(); ++i)
        distances.insert(distances.end(), o.distances[i].begin() + static_cast<long>(i), o.distances[i].end());
    std::vector<int32_t> shape = {count(o.scoreRows, rows), count(o.scoreColumns, columns)};
    if (o.transposeScores) std::swap(shape[0], shape[1]);
    if (o.writeClusters) WriteDataFile(DataFile(kClusterFileName), {count(o.clusterCount, o.centres.size())}, centres);
    if (o.writeStyles) WriteDataFile(DataFile(kStyleFileName), {count(o.styleCount, o.styles.size())}, styles);
    if (o.writeScores) WriteDataFile(DataFile(kScoresFileName), shape, scores);
    if (o.writeDistances)
        WriteDataFile(DataFile(kDistanceFileName), {count(o.distanceCount, o.distances.size())}, distances);
    WriteFixtureNetwork(m_modelDir + kNetworkFolder, o.network);
}

std::string ModelFixture::DataFile(const char* name) const { return DataFilePath(m_modelDir, name); }

}  // namespace fixtures
}  // namespace vora
