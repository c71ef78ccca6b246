#include "modelkit/SceneDescriptor.h"

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>

#include "model/FeatureNetwork.h"

namespace vora {
namespace modelkit {

const char* const kFeaturesTop = "features";
const char* const kDescriptorTop = "descriptor";

namespace {

// Input: the library's 256 x 256 canvas; the data layer keeps the 227 x 227
// centre, which is exactly the resized photograph.
constexpr int kCanvasSize = 256;
constexpr int kCropSize = 227;
constexpr float kMeanValue = 128.0f;
constexpr float kInputScale = 0.0078125f;  // 1/128: bytes to about [-1, 1]

constexpr int kLevels = 4;         // pyramid levels: wavelengths 4, 8, 16, 32 px at 227
constexpr int kOrientations = 6;   // 0, 30, ..., 150 degrees
constexpr int kGaborSize = 11;
constexpr double kGaborWavelength = 4.0;
constexpr double kGaborSigma = 0.56 * kGaborWavelength;  // about one octave of bandwidth
constexpr int kGrid = 4;           // finest pooling grid; 2 x 2 and 1 x 1 follow
constexpr int kCellsPerMap = kGrid * kGrid + 4 + 1;
constexpr int kColourChannels = 3;

// Size after the binomial blur with stride 2 (kernel 5, pad 2, floor).
int Downsampled(int size) { return (size - 1) / 2 + 1; }

int LevelSize(int level) {
    int size = kCropSize;
    for (int l = 0; l < level; ++l) size = Downsampled(size);
    return size;
}

class DefinitionWriter {
public:
    explicit DefinitionWriter(const std::string& name) { m_text << "name: \"" << name << "\"\n"; }

    void DataLayer() {
        m_text << "layer {\n  name: \"data\"\n  type: \"MemoryData\"\n  top: \"data\"\n  top: \"label\"\n"
               << "  transform_param {\n    scale: " << Float(kInputScale) << "\n    crop_size: " << kCropSize << "\n";
        for (int c = 0; c < 3; ++c) m_text << "    mean_value: " << Float(kMeanValue) << "\n";
        m_text << "  }\n  memory_data_param {\n    batch_size: 1\n    channels: 3\n    height: " << kCanvasSize
               << "\n    width: " << kCanvasSize << "\n  }\n}\n";
    }

    void Convolution(const std::string& name, const std::string& bottom, int outputs, int kernel, int stride, int pad) {
        Open(name, "Convolution", {bottom});
        m_text << "  convolution_param {\n    num_output: " << outputs << "\n    bias_term: false\n    kernel_size: "
               << kernel << "\n    stride: " << stride << "\n    pad: " << pad << "\n  }\n}\n";
    }

    void AveragePool(const std::string& name, const std::string& bottom, int kernel, int stride) {
        Open(name, "Pooling", {bottom});
        m_text << "  pooling_param {\n    pool: AVE\n    kernel_size: " << kernel << "\n    stride: " << stride << "\n  }\n}\n";
    }

    void Simple(const std::string& name, const std::string& type, const std::vector<std::string>& bottoms) {
        Open(name, type, bottoms);
        m_text << "}\n";
    }

    void Power(const std::string& name, const std::string& bottom, float power) {
        Open(name, "Power", {bottom});
        m_text << "  power_param {\n    power: " << Float(power) << "\n    scale: 1\n    shift: 0\n  }\n}\n";
    }

    void Concat(const std::string& name, const std::vector<std::string>& bottoms) {
        Open(name, "Concat", bottoms);
        m_text << "  concat_param {\n    axis: 1\n  }\n}\n";
    }

    void InnerProduct(const std::string& name, const std::string& bottom, int outputs) {
        Open(name, "InnerProduct", {bottom});
        m_text << "  inner_product_param {\n    num_output: " << outputs << "\n    bias_term: true\n  }\n}\n";
    }

    std::string Text() const { return m_text.str(); }

private:
    void Open(const std::string& name, const std::string& type, const std::vector<std::string>& bottoms) {
        m_text << "layer {\n  name: \"" << name << "\"\n  type: \"" << type << "\"\n";
        for (const std::string& bottom : bottoms) m_text << "  bottom: \"" << bottom << "\"\n";
        m_text << "  top: \"" << name << "\"\n";
    }

    // Shortest text that reads back to the same float.
    static std::string Float(float value) {
        std::ostringstream out;
        out.precision(9);
        out << value;
        return out.str();
    }

    std::ostringstream m_text;
};

WeightsLayer ConvolutionWeights(const std::string& name, int outputs, int inputs, int kernel, std::vector<float> data) {
    WeightsLayer layer{name, "Convolution", {}, {}, {}};
    layer.blobs.push_back({{outputs, inputs, kernel, kernel}, std::move(data)});
    return layer;
}

// Input channels are B, G, R. Intensity, red-green and yellow-blue, each
// about [-1, 1] for the input scaling above.
std::vector<float> OpponentWeights() {
    return {1.0f / 3, 1.0f / 3, 1.0f / 3,   // intensity
            0.0f, -0.5f, 0.5f,              // red - green
            -0.5f, 0.25f, 0.25f};           // (red + green) / 2 - blue
}

std::vector<float> BinomialWeights() {
    const float taps[5] = {1, 4, 6, 4, 1};
    std::vector<float> kernel;
    for (float y : taps)
        for (float x : taps) kernel.push_back(y * x / 256.0f);
    return kernel;
}

// Even (cosine) filters for all orientations, then odd (sine) ones; each has
// zero mean, so flat areas give nothing, and unit energy.
std::vector<float> GaborWeights() {
    const int half = kGaborSize / 2;
    const double pi = std::acos(-1.0);
    std::vector<float> weights;
    for (int phase = 0; phase < 2; ++phase) {
        for (int o = 0; o < kOrientations; ++o) {
            const double theta = pi * o / kOrientations;
            std::vector<double> kernel;
            double sum = 0.0;
            for (int y = -half; y <= half; ++y) {
                for (int x = -half; x <= half; ++x) {
                    const double along = x * std::cos(theta) + y * std::sin(theta);
                    const double envelope = std::exp(-(x * x + y * y) / (2.0 * kGaborSigma * kGaborSigma));
                    const double carrier = phase == 0 ? std::cos(2.0 * pi * along / kGaborWavelength)
                                                      : std::sin(2.0 * pi * along / kGaborWavelength);
                    kernel.push_back(envelope * carrier);
                    sum += envelope * carrier;
                }
            }
            const double mean = sum / static_cast<double>(kernel.size());
            double energy = 0.0;
            for (double& v : kernel) {
                v -= mean;
                energy += v * v;
            }
            const double norm = 1.0 / std::sqrt(energy);
            for (double v : kernel) weights.push_back(static_cast<float>(v * norm));
        }
    }
    return weights;
}

// Sums each even response with its odd partner: a phase-free local energy.
std::vector<float> PairSumWeights() {
    std::vector<float> weights(kOrientations * 2 * kOrientations, 0.0f);
    for (int o = 0; o < kOrientations; ++o) {
        weights[o * 2 * kOrientations + o] = 1.0f;
        weights[o * 2 * kOrientations + kOrientations + o] = 1.0f;
    }
    return weights;
}

// A 4 x 4 grid of average pools that fits a map of the given size exactly, so
// floor and ceiling rounding of the output size agree: stride size / 4, and a
// kernel that makes the last cell end on the last pixel.
void GridPool(DefinitionWriter& net, const std::string& name, const std::string& bottom, int size) {
    const int stride = size / kGrid;
    const int kernel = size - (kGrid - 1) * stride;
    net.AveragePool(name, bottom, kernel, stride);
}

// The three grid levels of one map, flattened, appended to tops.
void Pyramid(DefinitionWriter& net, const std::string& fine, std::vector<std::string>& tops) {
    net.AveragePool(fine + "_2x2", fine, 2, 2);
    net.AveragePool(fine + "_1x1", fine + "_2x2", 2, 2);
    for (const std::string& map : {fine, fine + "_2x2", fine + "_1x1"}) {
        net.Simple(map + "_flat", "Flatten", {map});
        tops.push_back(map + "_flat");
    }
}

NetworkFiles BuildNetwork(const Projection* projection) {
    DefinitionWriter net("vora_scene_descriptor");
    std::vector<WeightsLayer> weights;

    net.DataLayer();
    net.Convolution("intensity", "data", 1, 1, 1, 0);
    weights.push_back(ConvolutionWeights("intensity", 1, 3, 1, {1.0f / 3, 1.0f / 3, 1.0f / 3}));
    net.Convolution("opponent", "data", kColourChannels, 1, 1, 0);
    weights.push_back(ConvolutionWeights("opponent", kColourChannels, 3, 1, OpponentWeights()));

    std::vector<std::string> textureTops;
    std::string level = "intensity";
    for (int l = 0; l < kLevels; ++l) {
        const std::string suffix = std::to_string(l);
        if (l > 0) {
            const std::string down = "intensity" + suffix;
            net.Convolution(down, level, 1, 5, 2, 2);
            weights.push_back(ConvolutionWeights(down, 1, 1, 5, BinomialWeights()));
            level = down;
        }
        net.Convolution("gabor" + suffix, level, 2 * kOrientations, kGaborSize, 1, kGaborSize / 2);
        weights.push_back(ConvolutionWeights("gabor" + suffix, 2 * kOrientations, 1, kGaborSize, GaborWeights()));
        net.Simple("rectified" + suffix, "AbsVal", {"gabor" + suffix});
        GridPool(net, "cells" + suffix, "rectified" + suffix, LevelSize(l));
        net.Convolution("energy" + suffix, "cells" + suffix, kOrientations, 1, 1, 0);
        weights.push_back(ConvolutionWeights("energy" + suffix, kOrientations, 2 * kOrientations, 1, PairSumWeights()));
        Pyramid(net, "energy" + suffix, textureTops);
    }
    net.Concat("texture", textureTops);
    // The square root evens out the spread between busy and calm scenes and
    // halves the effect of a global contrast change.
    net.Power("texture_root", "texture", 0.5f);

    std::vector<std::string> featureTops{"texture_root"};
    GridPool(net, "colour", "opponent", kCropSize);
    Pyramid(net, "colour", featureTops);
    net.Concat(kFeaturesTop, featureTops);

    if (projection) {
        net.InnerProduct(kDescriptorTop, kFeaturesTop, kDescriptorSize);
        WeightsLayer layer{kDescriptorTop, "InnerProduct", {}, {}, {}};
        layer.blobs.push_back({{kDescriptorSize, projection->featureSize}, projection->weights});
        layer.blobs.push_back({{kDescriptorSize}, projection->bias});
        weights.push_back(std::move(layer));
    }
    return {net.Text(), std::move(weights)};
}

void WriteText(const std::string& path, const std::string& text) {
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file.write(text.data(), static_cast<std::streamsize>(text.size()));
    if (!file.flush()) throw std::runtime_error("cannot write " + path);
}

}  // namespace

int PooledFeatureSize() { return (kLevels * kOrientations + kColourChannels) * kCellsPerMap; }

NetworkFiles PooledFeatureNetwork() { return BuildNetwork(nullptr); }

NetworkFiles DescriptorNetwork(const Projection& projection) {
    if (projection.featureSize != PooledFeatureSize() ||
        projection.weights.size() != static_cast<size_t>(kDescriptorSize) * projection.featureSize ||
        projection.bias.size() != static_cast<size_t>(kDescriptorSize))
        throw std::runtime_error("the descriptor projection does not fit the pooled features");
    return BuildNetwork(&projection);
}

Projection FitProjection(const cv::Mat& pooledFeatures, double damping) {
    if (pooledFeatures.empty() || pooledFeatures.type() != CV_32F)
        throw std::runtime_error("no pooled features to fit the descriptor projection on");
    const int rows = pooledFeatures.rows;
    const int cols = pooledFeatures.cols;
    cv::Mat samples;
    pooledFeatures.convertTo(samples, CV_64F);

    // Standardise each column; a constant column keeps unit scale.
    cv::Mat mean, spread;
    cv::reduce(samples, mean, 0, cv::REDUCE_AVG, CV_64F);
    std::vector<double> scale(cols, 1.0);
    for (int c = 0; c < cols; ++c) {
        double sum = 0.0;
        for (int r = 0; r < rows; ++r) {
            const double d = samples.at<double>(r, c) - mean.at<double>(0, c);
            sum += d * d;
        }
        const double deviation = std::sqrt(sum / rows);
        if (deviation > 1e-12) scale[c] = 1.0 / deviation;
    }
    cv::Mat standard(rows, cols, CV_64F);
    for (int r = 0; r < rows; ++r)
        for (int c = 0; c < cols; ++c)
            standard.at<double>(r, c) = (samples.at<double>(r, c) - mean.at<double>(0, c)) * scale[c];

    cv::Mat covariance = standard.t() * standard / static_cast<double>(rows);
    cv::Mat eigenvalues, eigenvectors;
    cv::eigen(covariance, eigenvalues, eigenvectors);  // descending eigenvalues, vectors as rows

    Projection projection;
    projection.featureSize = cols;
    projection.weights.assign(static_cast<size_t>(kDescriptorSize) * cols, 0.0f);
    projection.bias.assign(kDescriptorSize, 0.0f);
    const double largest = eigenvalues.at<double>(0);
    if (!(largest > 0.0)) return projection;  // all photos alike: nothing to project
    const int components = std::min({kDescriptorSize, cols, rows - 1});
    for (int k = 0; k < components; ++k) {
        const double variance = eigenvalues.at<double>(k);
        if (variance <= largest * 1e-12) break;  // beyond the data's rank
        const double* vector = eigenvectors.ptr<double>(k);
        int peak = 0;
        for (int c = 1; c < cols; ++c)
            if (std::fabs(vector[c]) > std::fabs(vector[peak])) peak = c;
        const double sign = vector[peak] < 0.0 ? -1.0 : 1.0;
        const double gain = sign / std::sqrt(variance + damping * largest);
        double bias = 0.0;
        for (int c = 0; c < cols; ++c) {
            const double w = vector[c] * scale[c] * gain;
            projection.weights[static_cast<size_t>(k) * cols + c] = static_cast<float>(w);
            bias -= w * mean.at<double>(0, c);
        }
        projection.bias[k] = static_cast<float>(bias);
    }
    return projection;
}

std::vector<float> Project(const Projection& projection, const float* pooled) {
    std::vector<float> out(kDescriptorSize);
    const int cols = projection.featureSize;
    for (int k = 0; k < kDescriptorSize; ++k) {
        double sum = projection.bias[k];
        const float* row = projection.weights.data() + static_cast<size_t>(k) * cols;
        for (int c = 0; c < cols; ++c) sum += static_cast<double>(row[c]) * pooled[c];
        out[k] = static_cast<float>(sum);
    }
    return out;
}

void WriteNetworkFiles(const NetworkFiles& network, const std::string& dir) {
    const std::string definition = (std::filesystem::path(dir) / kNetworkDefinitionName).string();
    const std::string weights = (std::filesystem::path(dir) / kNetworkWeightsName).string();
    WriteText(definition, network.definition);
    if (!WriteWeightsFile(weights, network.name, network.weights))
        throw std::runtime_error("cannot write " + weights);
}

}  // namespace modelkit
}  // namespace vora
