#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <numeric>
#include <string>

#include <opencv2/core.hpp>

#include "model/FeatureNetwork.h"
#include "model/ProtoText.h"
#include "support/ModelFixtures.h"

namespace vora {
namespace {

using fixtures::NetworkOptions;

const std::string kMemoryDataLayer = R"(
layer { name: "input" type: "MemoryData" top: "data" top: "label"
  memory_data_param { batch_size: 1 channels: 3 height: 8 width: 10 }
  transform_param { crop_size: 5 mean_value: 10 mean_value: 20 mean_value: 30 scale: 0.5 mirror: true } }
)";

cv::Mat RandomImage(int rows, int cols, int type, uint64_t seed) {
    cv::Mat image(rows, cols, type);
    cv::RNG(seed).fill(image, cv::RNG::UNIFORM, 0, 256);
    return image;
}

bool SameFloats(const cv::Mat& a, const float* b, size_t count) {
    return a.total() == count && std::memcmp(a.ptr<float>(), b, count * sizeof(float)) == 0;
}

// A network folder that lives as long as the test.
struct TempNetwork {
    fixtures::TempFolder temp;
    std::string folder = temp.path() + "/";
    std::unique_ptr<FeatureNetwork> Load() const {
        return FeatureNetwork::Load(folder + kNetworkDefinitionName, folder + kNetworkWeightsName);
    }
};

TEST(FeatureNetwork, RefusesDefinitionsItCannotHonour) {
    const std::string layer = R"(layer { type: "MemoryData" top: "d" memory_data_param { channels: 3 )";
    for (const std::string& text : {
             layer + "height: 4 width: 4 } transform_param { mean_value: 1 mean_value: 2 } }",
             layer + "height: 4 width: 4 } transform_param { mean_value: 1 mean_file: \"m.binaryproto\" } }",
             layer + "width: 4 } }",                                          // no height
             layer + "height: 4 width: 4 } transform_param { crop_size: 5 } }",  // crop larger than the input
             layer + "height: 4 width: 4 } transform_param { scale: \"half\" } }",
             kMemoryDataLayer + R"(layer { name: "sink" type: "Silence" bottom: "data" })",  // no output
         })
        EXPECT_THROW(PrepareDefinition(text), cv::Exception) << text;
}

TEST(FeatureNetwork, OutputIsTheFirstUnconsumedTopByName) {
    // Unconsumed: "label" (left with the data layer), "zeta", "mu" (written last by the in-place relu);
    // the layers a testing network leaves out do not count, not even as the first layer.
    const PreparedDefinition several = PrepareDefinition(R"(
layer { name: "train" type: "Data" top: "data" top: "label" include { phase: TRAIN } })" + kMemoryDataLayer + R"(
layer { name: "z" type: "Pooling" bottom: "data" top: "zeta" }
layer { name: "fc" type: "InnerProduct" bottom: "data" top: "mu" }
layer { name: "relu" type: "ReLU" bottom: "mu" top: "mu" include { phase: TEST } }
layer { name: "loss" type: "Softmax" bottom: "mu" top: "a" exclude { phase: TEST } })");
    EXPECT_EQ(several.outputTop + " " + several.outputLayer, "mu relu");
    ASSERT_TRUE(several.memoryData);
    EXPECT_EQ(prototext::Parse(several.text).First("input_shape")->message.Scalars("dim"),
              (std::vector<std::string>{"1", "3", "5", "5"}));
    // The second top of a layer; the old layer format names the type by its enum.
    const PreparedDefinition second = PrepareDefinition(R"(
layers { name: "d" type: MEMORY_DATA top: "data" top: "label" memory_data_param { channels: 3 height: 4 width: 4 } }
layers { name: "split" type: SLICE bottom: "data" top: "x" top: "a" }
layers { name: "use" type: ELTWISE bottom: "x" top: "z" })");
    EXPECT_TRUE(second.memoryData);
    EXPECT_EQ(second.outputTop + " " + second.outputLayer + " " + std::to_string(second.outputIndex), "a split 1");
}

TEST(FeatureNetwork, TransformMatchesHandComputedBlob) {
    const cv::Mat image = RandomImage(8, 11, CV_8UC3, 3);  // odd margins: crop offsets (1, 3)
    // Channels, height, width, crop, scale, means, mean blob: a cropped mean blob, and the whole image's raw
    // values. Mean values, one or per channel, are tested through the network
    // (FixtureNetworkGivesTheHandComputedFeature, NetworkReceivesExactlyTheTransformedImage).
    const InputTransform cases[] = {{3, 8, 11, 5, 0.5f, {}, fixtures::RandomMean(8, 11)}, {3, 8, 11, 0, 1.0f, {}, {}}};
    for (const InputTransform& t : cases) {
        const cv::Mat expected = fixtures::HandInputBlob(image, t);
        EXPECT_TRUE(SameFloats(ApplyInputTransform(t, image), expected.ptr<float>(), expected.total()))
            << t.cropSize << " " << t.scale;
    }
    // Under the crop, wrong channels, wrong depth, not the mean blob's size; uncropped, not height x width.
    const InputTransform crop{3, 8, 8, 8, 1.0f, {}, fixtures::RandomMean(8, 8)}, whole{3, 8, 8, 0, 1.0f, {}, {}};
    for (const cv::Mat& bad : {RandomImage(7, 9, CV_8UC3, 1), RandomImage(8, 8, CV_8UC1, 1),
                               RandomImage(8, 8, CV_16UC3, 1), RandomImage(9, 8, CV_8UC3, 1)})
        EXPECT_THROW(ApplyInputTransform(crop, bad), cv::Exception);
    EXPECT_THROW(ApplyInputTransform(whole, RandomImage(8, 9, CV_8UC3, 1)), cv::Exception);
}

TEST(FeatureNetwork, NetworkReceivesExactlyTheTransformedImage) {
    // Identity, then x2 in place under a repeated name, which the dnn module
    // calls "scale_1"; an unconsumed "zmax" sorts after the output.
    TempNetwork files;
    fixtures::WriteNetworkFiles(files.folder, kMemoryDataLayer + R"(
layer { name: "scale" type: "Pooling" bottom: "data" top: "copy" pooling_param { pool: MAX kernel_size: 1 } }
layer { name: "scale" type: "Power" bottom: "copy" top: "copy" power_param { scale: 2 } }
layer { name: "other" type: "Pooling" bottom: "data" top: "zmax" pooling_param { pool: MAX global_pooling: true } })",
                                {});
    const std::unique_ptr<FeatureNetwork> network = files.Load();
    EXPECT_EQ(network->outputName() + " " + network->outputLayer(), "copy scale_1");
    const cv::Mat image = RandomImage(8, 10, CV_8UC3, 11);
    const std::vector<float> output = network->Forward(image);
    // Doubling is exact in float.
    const cv::Mat expected = fixtures::HandInputBlob(image, {3, 8, 10, 5, 0.5f, {10, 20, 30}, {}}) * 2.0f;
    EXPECT_TRUE(SameFloats(expected, output.data(), output.size()));
}

TEST(FeatureNetwork, FixtureNetworkGivesTheHandComputedFeature) {
    const cv::Mat image = RandomImage(256, 256, CV_8UC3, 5);
    const std::function<void(NetworkOptions&)> variants[] = {
        [](NetworkOptions&) {},
        [](NetworkOptions& o) { o.cropSize = 0, o.meanValues = {120.0f}, o.writeScale = false; },  // no crop, scale 1
        [](NetworkOptions& o) { o.meanFile = true; }, [](NetworkOptions& o) { o.memoryData = false; },
    };
    for (const auto& change : variants) {
        NetworkOptions o;
        change(o);
        TempNetwork files;
        fixtures::WriteFixtureNetwork(files.folder, o);
        const std::vector<float> feature = files.Load()->Forward(image), expected = fixtures::ExpectedFeature(o, image);
        EXPECT_LT(cv::norm(feature, expected, cv::NORM_INF), 1e-4 * (1.0 + cv::norm(expected, cv::NORM_INF)));
    }
}

TEST(FeatureNetwork, ReadsMeanBlobsInTheLegacyLayout) {
    // num/channels/height/width fields (one varint byte each), then the values
    // unpacked or packed; the fixture network's mean file covers the shaped layout.
    TempNetwork files;
    std::vector<float> values(2 * 3 * 4);
    std::iota(values.begin(), values.end(), 0.5f);
    const std::string raw(reinterpret_cast<const char*>(values.data()), 4 * values.size());
    std::string unpacked = {8, 1, 16, 2, 24, 3, 32, 4}, packed = unpacked + '\x2a' + char(raw.size()) + raw;
    for (size_t i = 0; i < raw.size(); i += 4) unpacked += '\x2d' + raw.substr(i, 4);
    const auto read = [&files](const std::string& bytes, int channels = 2) {
        fixtures::WriteBytes(files.folder + "mean", bytes);
        return ReadMeanBlob(files.folder + "mean", channels, 3, 4);
    };
    EXPECT_TRUE(SameFloats(read(unpacked), values.data(), values.size()));
    EXPECT_TRUE(SameFloats(read(packed), values.data(), values.size()));
    EXPECT_THROW(read(unpacked, 3), cv::Exception);  // another size
    EXPECT_THROW(read(unpacked.substr(0, 13)), cv::Exception);
    EXPECT_THROW(ReadMeanBlob(files.folder + "absent", 2, 3, 4), cv::Exception);
    // Cut in the middle of the last value, unpacked and packed: refused, not read as 0.
    EXPECT_THROW(read(unpacked.substr(0, unpacked.size() - 2)), cv::Exception);
    packed[9] = static_cast<char>(raw.size() - 2);  // the length itself cuts the last value
    EXPECT_THROW(read(packed.substr(0, packed.size() - 2)), cv::Exception);
}

}  // namespace
}  // namespace vora
