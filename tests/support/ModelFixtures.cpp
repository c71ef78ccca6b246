#include "support/ModelFixtures.h"

#include <stdlib.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
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

constexpr int kSize = 256;  // the fixture network's input height and width

template <typename T>
void Append(std::string& bytes, const std::vector<T>& values) {
    bytes.append(reinterpret_cast<const char*>(values.data()), values.size() * sizeof(T));
}

std::string FloatText(float value) {
    char text[32];
    std::snprintf(text, sizeof text, "%.9g", static_cast<double>(value));
    return text;
}

float Weight(int k, int c) { return static_cast<float>(std::sin(0.7 * k + 2.1 * c)); }
float Bias(int k) { return static_cast<float>(0.1 * std::cos(1.3 * k)); }

std::string FixtureDefinition(const NetworkOptions& options) {
    std::ostringstream text;
    text << "name: \"vora_fixture\"\n";
    if (options.memoryData) {
        text << "layer { name: \"data\" type: \"MemoryData\" top: \"data\" top: \"label\"\n"
             << "  memory_data_param { batch_size: 1 channels: 3 height: " << kSize << " width: " << kSize << " }\n"
             << "  transform_param {\n";
        if (options.cropSize > 0) text << "    crop_size: " << options.cropSize << "\n";
        if (options.meanFile) text << "    mean_file: \"mean.binaryproto\"\n";
        for (float mean : options.meanFile ? std::vector<float>() : options.meanValues)
            text << "    mean_value: " << FloatText(mean) << "\n";
        if (options.writeScale) text << "    scale: " << FloatText(options.scale) << "\n";
        text << "  }\n}\n";
    } else {
        text << "input: \"data\"\ninput_shape { dim: 1 dim: 3 dim: " << kSize << " dim: " << kSize << " }\n";
    }
    text << "layer { name: \"pool\" type: \"Pooling\" bottom: \"data\" top: \"pool\"\n"
         << "  pooling_param { pool: AVE global_pooling: true } }\n"
         << "layer { name: \"fc512\" type: \"InnerProduct\" bottom: \"pool\" top: \"fc512\"\n"
         << "  inner_product_param { num_output: " << options.outputs << " } }\n";
    if (options.reluOnOutput) text << "layer { name: \"relu\" type: \"ReLU\" bottom: \"fc512\" top: \"fc512\" }\n";
    return text.str();
}

}  // namespace

void WriteBytes(const std::string& path, const std::string& bytes) {
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
    if (!file.flush()) throw std::runtime_error("cannot write " + path);
}

void TruncateFile(const std::string& path, size_t size) { std::filesystem::resize_file(path, size); }

void WriteDataFile(const std::string& path, const std::vector<int32_t>& header, const std::vector<float>& values) {
    std::string bytes;
    Append(bytes, header);
    Append(bytes, values);
    WriteBytes(path, bytes);
}

cv::Mat GradientMean(int height, int width) {
    const int sizes[3] = {3, height, width};
    cv::Mat mean(3, sizes, CV_32F);
    for (int c = 0; c < 3; ++c)
        for (int y = 0; y < height; ++y)
            for (int x = 0; x < width; ++x)
                mean.ptr<float>(c, y)[x] = 90.0f + static_cast<float>((37 * c + y + 2 * x) % 61) * 0.5f;
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
    WeightsLayer fc{"fc512", "InnerProduct", {"pool"}, {"fc512"}, {WeightsBlob(), WeightsBlob()}};
    fc.blobs[0].shape = {options.outputs, 3};
    fc.blobs[1].shape = {options.outputs};
    for (int k = 0; k < options.outputs; ++k) {
        for (int c = 0; c < 3; ++c) fc.blobs[0].data.push_back(Weight(k, c));
        fc.blobs[1].data.push_back(Bias(k));
    }
    WriteNetworkFiles(folder, FixtureDefinition(options), {fc});
    if (options.meanFile) {
        const cv::Mat mean = GradientMean(kSize, kSize);
        WeightsBlob blob{{1, 3, kSize, kSize}, std::vector<float>(mean.ptr<float>(), mean.ptr<float>() + mean.total())};
        WriteBytes(folder + "mean.binaryproto", SerializeBlob(blob));
    }
    if (options.files == Files::MissingDefinition) std::filesystem::remove(folder + kNetworkDefinitionName);
    if (options.files == Files::MissingWeights) std::filesystem::remove(folder + kNetworkWeightsName);
    if (options.files == Files::GarbledDefinition)
        WriteBytes(folder + kNetworkDefinitionName, "name: \"broken\"\nlayer {\n  name: \"data\"\n  type: {{\n");
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
                const float pixel = bgr8.at<cv::Vec3b>(top + y, left + x)[c];
                blob.ptr<float>(0, c, y)[x] = (pixel - mean) * t.scale;
            }
    return blob;
}

std::vector<float> ExpectedFeature(const NetworkOptions& o, const cv::Mat& bgr8) {
    InputTransform transform;  // a plain input: the raw pixel values
    if (o.memoryData)
        transform = {3, kSize, kSize, o.cropSize, o.writeScale ? o.scale : 1.0f,
                     o.meanFile ? std::vector<float>() : o.meanValues, o.meanFile ? GradientMean(kSize, kSize) : cv::Mat()};
    cv::Mat pooled;
    cv::reduce(HandInputBlob(bgr8, transform).reshape(1, 3), pooled, 1, cv::REDUCE_AVG, CV_64F);
    std::vector<float> feature;
    for (int k = 0; k < o.outputs; ++k) {
        double value = Bias(k);
        for (int c = 0; c < 3; ++c) value += static_cast<double>(Weight(k, c)) * pooled.at<double>(c);
        feature.push_back(static_cast<float>(o.reluOnOutput ? std::max(value, 0.0) : value));
    }
    return feature;
}

std::vector<float> ExpectedFeatureForColour(const NetworkOptions& options, const cv::Vec3b& bgr) {
    return ExpectedFeature(options, cv::Mat(kSize, kSize, CV_8UC3, cv::Scalar(bgr[0], bgr[1], bgr[2])));
}

ClusterCentre CentreFromFeature(const std::vector<float>& feature) {
    ClusterCentre centre{};
    std::copy_n(feature.begin(), std::min(feature.size(), centre.size()), centre.begin());
    return centre;
}

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
        style.chromaSqrtCov[0] = 2.0f + unit(random) * 8.0f;
        style.chromaSqrtCov[1] = style.chromaSqrtCov[2] = unit(random) * 2.0f - 1.0f;
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

ModelFixture::ModelFixture(const FixtureOptions& o) : m_root(MakeTempFolder()) {
    try {
        const std::string dataFolder = m_root + (o.trailingSeparator ? "/model/" : "/m/");
        m_modelDir = o.trailingSeparator ? dataFolder : m_root + "/m";
        std::filesystem::create_directories(dataFolder);
        const auto size = [](size_t n) { return static_cast<int32_t>(n); };
        std::vector<float> centres, styles, scores, distances;
        for (const ClusterCentre& centre : o.centres) centres.insert(centres.end(), centre.begin(), centre.end());
        for (const ColourStats& style : o.styles) styles.insert(styles.end(), style.data(), style.data() + 38);
        const size_t columns = o.scores.empty() ? o.styles.size() : o.scores[0].size();
        for (size_t i = 0; i < o.scores.size() * columns; ++i)
            scores.push_back(o.transposeScores ? o.scores[i % o.scores.size()][i / o.scores.size()]
                                               : o.scores[i / columns][i % columns]);
        for (size_t i = 0; i < o.distances.size(); ++i)
            distances.insert(distances.end(), o.distances[i].begin() + static_cast<long>(i), o.distances[i].end());

        const int32_t rows = o.scoreRows.value_or(size(o.scores.size()));
        const int32_t cols = o.scoreColumns.value_or(size(columns));
        if (o.writeClusters)
            WriteDataFile(DataFile(kClusterFileName), {o.clusterCount.value_or(size(o.centres.size()))}, centres);
        if (o.writeStyles)
            WriteDataFile(DataFile(kStyleFileName), {o.styleCount.value_or(size(o.styles.size()))}, styles);
        if (o.writeScores)
            WriteDataFile(DataFile(kScoresFileName), o.transposeScores ? std::vector<int32_t>{cols, rows}
                                                                       : std::vector<int32_t>{rows, cols}, scores);
        if (o.writeDistances)
            WriteDataFile(DataFile(kDistanceFileName), {o.distanceCount.value_or(size(o.distances.size()))},
                          distances);
        WriteFixtureNetwork(m_modelDir + kNetworkFolder, o.network);
    } catch (...) {
        RemoveTree(m_root);
        throw;
    }
}

ModelFixture::~ModelFixture() { RemoveTree(m_root); }

std::string ModelFixture::DataFile(const char* name) const { return DataFilePath(m_modelDir, name); }

}  // namespace fixtures
}  // namespace vora
