#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <string>

#include <opencv2/core.hpp>

#include "model/FeatureNetwork.h"
#include "model/NetworkWriter.h"
#include "model/ProtoText.h"
#include "support/ModelFixtures.h"

namespace vora {
namespace {

using fixtures::NetworkOptions;

const char* const kMemoryDataLayer = R"(
layer {
  name: "input"
  type: "MemoryData"
  top: "data"
  top: "label"
  memory_data_param { batch_size: 1 channels: 3 height: 8 width: 10 }
  transform_param { crop_size: 5 mean_value: 10 mean_value: 20 mean_value: 30 scale: 0.5 mirror: true }
}
)";

cv::Mat RandomImage(int rows, int cols, int type, uint64_t seed) {
    cv::Mat image(rows, cols, type);
    cv::RNG rng(seed);
    rng.fill(image, cv::RNG::UNIFORM, 0, 256);
    return image;
}

// The input blob written out plainly: crop at the centre, (pixel - mean) x
// scale in float, plane by plane.
cv::Mat HandBlob(const cv::Mat& bgr8, int crop, const std::vector<float>& means, float scale,
                 const cv::Mat& meanBlob = cv::Mat()) {
    const int rows = crop > 0 ? crop : bgr8.rows;
    const int cols = crop > 0 ? crop : bgr8.cols;
    const int top = (bgr8.rows - rows) / 2;
    const int left = (bgr8.cols - cols) / 2;
    const int shape[4] = {1, 3, rows, cols};
    cv::Mat blob(4, shape, CV_32F);
    for (int c = 0; c < 3; ++c)
        for (int y = 0; y < rows; ++y)
            for (int x = 0; x < cols; ++x) {
                float mean = 0.0f;
                if (!meanBlob.empty())
                    mean = meanBlob.ptr<float>(c, top + y)[left + x];
                else if (!means.empty())
                    mean = means.size() == 1 ? means[0] : means[static_cast<size_t>(c)];
                const float pixel = bgr8.at<cv::Vec3b>(top + y, left + x)[c];
                blob.ptr<float>(0, c, y)[x] = (pixel - mean) * scale;
            }
    return blob;
}

bool SameFloats(const cv::Mat& a, const cv::Mat& b) {
    return a.total() == b.total() && std::memcmp(a.ptr<float>(), b.ptr<float>(), a.total() * sizeof(float)) == 0;
}

void ExpectClose(const std::vector<float>& actual, const std::vector<float>& expected) {
    ASSERT_EQ(actual.size(), expected.size());
    for (size_t i = 0; i < actual.size(); ++i)
        ASSERT_NEAR(actual[i], expected[i], 1e-4 * (1.0 + std::fabs(expected[i]))) << i;
}

// A network folder that lives as long as the test.
struct TempNetwork {
    std::string folder = fixtures::MakeTempFolder() + "/";
    ~TempNetwork() { fixtures::RemoveTree(folder); }
    std::string Definition() const { return folder + kNetworkDefinitionName; }
    std::string Weights() const { return folder + kNetworkWeightsName; }
    std::unique_ptr<FeatureNetwork> Load() const { return FeatureNetwork::Load(Definition(), Weights()); }
};

TEST(FeatureNetwork, FileNames) {
    EXPECT_STREQ(kNetworkFolder, "net/");
    EXPECT_STREQ(kNetworkDefinitionName, "deploy2.prototxt");
    EXPECT_STREQ(kNetworkWeightsName, "caffe_reduce_512_model");
}

TEST(FeatureNetwork, MemoryDataBecomesAPlainInputOfTheCroppedSize) {
    const PreparedDefinition prepared = PrepareDefinition(std::string("name: \"n\"\n") + kMemoryDataLayer + R"(
layer { name: "pool" type: "Pooling" bottom: "data" top: "pool" })");
    EXPECT_TRUE(prepared.memoryData);
    EXPECT_EQ(prepared.inputName, "data");
    EXPECT_EQ(prepared.transform.channels, 3);
    EXPECT_EQ(prepared.transform.height, 8);
    EXPECT_EQ(prepared.transform.width, 10);
    EXPECT_EQ(prepared.transform.cropSize, 5);
    EXPECT_EQ(prepared.transform.meanValues, (std::vector<float>{10, 20, 30}));
    EXPECT_EQ(prepared.transform.scale, 0.5f);

    const prototext::Message net = prototext::Parse(prepared.text);
    EXPECT_EQ(net.Scalar("name"), "n");
    EXPECT_EQ(net.Scalars("input"), (std::vector<std::string>{"data"}));
    ASSERT_NE(net.First("input_shape"), nullptr);
    EXPECT_EQ(net.First("input_shape")->message.Scalars("dim"), (std::vector<std::string>{"1", "3", "5", "5"}));
    ASSERT_EQ(net.All("layer").size(), 1u);
    EXPECT_EQ(net.First("layer")->message.Scalar("type"), "Pooling");
    EXPECT_EQ(prepared.text.find("label"), std::string::npos);
}

TEST(FeatureNetwork, TransformDefaultsAndUncroppedShape) {
    const PreparedDefinition prepared = PrepareDefinition(R"(
layer { name: "d" type: "MemoryData" top: "pixels" top: "label"
        memory_data_param { batch_size: 4 channels: 1 height: 6 width: 7 } }
layer { name: "fc" type: "InnerProduct" bottom: "pixels" top: "fc" })");
    EXPECT_EQ(prepared.inputName, "pixels");
    EXPECT_EQ(prepared.transform.cropSize, 0);
    EXPECT_EQ(prepared.transform.scale, 1.0f);
    EXPECT_TRUE(prepared.transform.meanValues.empty());
    const prototext::Message net = prototext::Parse(prepared.text);
    EXPECT_EQ(net.First("input_shape")->message.Scalars("dim"), (std::vector<std::string>{"1", "1", "6", "7"}));
}

TEST(FeatureNetwork, OnlyAFirstLayerOfTypeMemoryDataIsReplaced) {
    // Commented out, inside a string, or in second place: none of these counts.
    const PreparedDefinition commented = PrepareDefinition(R"(
# layer { name: "old" type: "MemoryData" top: "data" memory_data_param { channels: 3 height: 4 width: 4 } }
input: "data"
input_shape { dim: 1 dim: 3 dim: 4 dim: 4 }
layer { name: "type: \"MemoryData\"" type: "Pooling" bottom: "data" top: "out" }
layer { name: "late" type: "MemoryData" top: "other" memory_data_param { channels: 3 height: 4 width: 4 } }
layer { name: "sink" type: "Eltwise" bottom: "out" bottom: "other" top: "sum" })");
    EXPECT_FALSE(commented.memoryData);
    EXPECT_EQ(commented.inputName, "data");
    EXPECT_EQ(prototext::Parse(commented.text).All("layer").size(), 3u);

    // The old layer format names the type by its enum.
    const PreparedDefinition old = PrepareDefinition(R"(
layers { name: "d" type: MEMORY_DATA top: "data" top: "label" memory_data_param { channels: 3 height: 4 width: 4 } }
layers { name: "fc" type: INNER_PRODUCT bottom: "data" top: "fc" })");
    EXPECT_TRUE(old.memoryData);
    EXPECT_EQ(old.outputTop, "fc");

    // Layers a testing network leaves out do not count as the first layer.
    const PreparedDefinition phased = PrepareDefinition(std::string(R"(
layer { name: "train" type: "Data" top: "data" top: "label" include { phase: TRAIN } })") + kMemoryDataLayer + R"(
layer { name: "loss" type: "SoftmaxWithLoss" bottom: "data" bottom: "label" top: "loss" exclude { phase: TEST } }
layer { name: "pool" type: "Pooling" bottom: "data" top: "pool" include { phase: TEST } })");
    EXPECT_TRUE(phased.memoryData);
    const prototext::Message net = prototext::Parse(phased.text);
    ASSERT_EQ(net.All("layer").size(), 1u);
    EXPECT_EQ(net.First("layer")->message.Scalar("name"), "pool");
    EXPECT_EQ(phased.outputTop, "pool");
}

TEST(FeatureNetwork, RefusesTransformsItCannotHonour) {
    const char* const bad[] = {
        // two means for three channels
        R"(layer { type: "MemoryData" top: "d" memory_data_param { channels: 3 height: 4 width: 4 }
                   transform_param { mean_value: 1 mean_value: 2 } })",
        // mean file and mean values together
        R"(layer { type: "MemoryData" top: "d" memory_data_param { channels: 3 height: 4 width: 4 }
                   transform_param { mean_value: 1 mean_file: "m.binaryproto" } })",
        // no height
        R"(layer { type: "MemoryData" top: "d" memory_data_param { channels: 3 width: 4 } })",
        // crop larger than the input
        R"(layer { type: "MemoryData" top: "d" memory_data_param { channels: 3 height: 4 width: 4 }
                   transform_param { crop_size: 5 } })",
        // a scale that is not a number
        R"(layer { type: "MemoryData" top: "d" memory_data_param { channels: 3 height: 4 width: 4 }
                   transform_param { scale: "half" } })",
    };
    for (const char* text : bad) EXPECT_THROW(PrepareDefinition(text), cv::Exception) << text;
}

TEST(FeatureNetwork, OutputIsTheFirstUnconsumedTopByName) {
    const PreparedDefinition several = PrepareDefinition(std::string(kMemoryDataLayer) + R"(
layer { name: "z" type: "Pooling" bottom: "data" top: "zeta" }
layer { name: "a" type: "Pooling" bottom: "data" top: "beta" }
layer { name: "m" type: "Pooling" bottom: "data" top: "mu" })");
    // "label" would sort first, but it left with the data layer.
    EXPECT_EQ(several.outputTop, "beta");
    EXPECT_EQ(several.outputLayer, "a");
    EXPECT_EQ(several.outputIndex, 0);

    const PreparedDefinition inPlace = PrepareDefinition(std::string(kMemoryDataLayer) + R"(
layer { name: "fc" type: "InnerProduct" bottom: "data" top: "feat" }
layer { name: "relu" type: "ReLU" bottom: "feat" top: "feat" }
layer { name: "split" type: "Slice" bottom: "data" top: "x" top: "y" }
layer { name: "use" type: "Eltwise" bottom: "x" top: "xx" })");
    // Unconsumed: feat, xx, y. In-place layers keep the blob's name.
    EXPECT_EQ(inPlace.outputTop, "feat");
    EXPECT_EQ(inPlace.outputLayer, "relu");

    const PreparedDefinition second = PrepareDefinition(std::string(kMemoryDataLayer) + R"(
layer { name: "split" type: "Slice" bottom: "data" top: "x" top: "a" }
layer { name: "use" type: "Eltwise" bottom: "x" top: "z" })");
    EXPECT_EQ(second.outputTop, "a");
    EXPECT_EQ(second.outputLayer, "split");
    EXPECT_EQ(second.outputIndex, 1);

    EXPECT_THROW(PrepareDefinition(std::string(kMemoryDataLayer) + R"(
layer { name: "sink" type: "Silence" bottom: "data" })"),
                 cv::Exception);
}

TEST(FeatureNetwork, TransformMatchesHandComputedBlob) {
    const cv::Mat image = RandomImage(8, 11, CV_8UC3, 3);  // odd margins: offsets (1, 3)
    InputTransform transform;
    transform.height = 8;
    transform.width = 11;
    transform.cropSize = 5;
    transform.scale = 0.017f;
    transform.meanValues = {103.94f, 116.78f, 123.68f};
    EXPECT_TRUE(SameFloats(ApplyInputTransform(transform, image), HandBlob(image, 5, transform.meanValues, 0.017f)));

    transform.meanValues = {100.5f};  // one mean for every channel
    EXPECT_TRUE(SameFloats(ApplyInputTransform(transform, image), HandBlob(image, 5, {100.5f}, 0.017f)));

    transform.cropSize = 0;  // whole image, no mean, no scale
    transform.meanValues.clear();
    transform.scale = 1.0f;
    const cv::Mat whole = ApplyInputTransform(transform, image);
    ASSERT_EQ(whole.size[2], 8);
    ASSERT_EQ(whole.size[3], 11);
    EXPECT_TRUE(SameFloats(whole, HandBlob(image, 0, {}, 1.0f)));
    EXPECT_EQ(whole.ptr<float>(0, 2, 7)[10], image.at<cv::Vec3b>(7, 10)[2]);

    NetworkOptions withMean;
    withMean.height = 8;
    withMean.width = 11;
    transform.cropSize = 5;
    transform.scale = 0.5f;
    transform.meanBlob = fixtures::FixtureMeanBlob(withMean);
    EXPECT_TRUE(
        SameFloats(ApplyInputTransform(transform, image), HandBlob(image, 5, {}, 0.5f, transform.meanBlob)));
}

TEST(FeatureNetwork, TransformRefusesImagesThatDoNotFit) {
    InputTransform transform;
    transform.height = 8;
    transform.width = 8;
    transform.cropSize = 5;
    EXPECT_THROW(ApplyInputTransform(transform, RandomImage(4, 8, CV_8UC3, 1)), cv::Exception);  // under the crop
    EXPECT_THROW(ApplyInputTransform(transform, RandomImage(8, 8, CV_8UC1, 1)), cv::Exception);  // channels
    EXPECT_THROW(ApplyInputTransform(transform, RandomImage(8, 8, CV_16UC3, 1)), cv::Exception); // depth
    transform.cropSize = 0;
    EXPECT_THROW(ApplyInputTransform(transform, RandomImage(8, 9, CV_8UC3, 1)), cv::Exception);  // size
    transform.cropSize = 5;
    NetworkOptions mean;
    mean.height = 8;
    mean.width = 8;
    transform.meanBlob = fixtures::FixtureMeanBlob(mean);
    EXPECT_THROW(ApplyInputTransform(transform, RandomImage(9, 8, CV_8UC3, 1)), cv::Exception);  // mean size
}

TEST(FeatureNetwork, NetworkReceivesExactlyTheTransformedImage) {
    // A data layer followed by an identity: the output is the input blob.
    TempNetwork files;
    fixtures::WriteNetworkFiles(files.folder, std::string(kMemoryDataLayer) + R"(
layer { name: "copy" type: "Pooling" bottom: "data" top: "copy"
        pooling_param { pool: MAX kernel_size: 1 stride: 1 } })",
                                {});
    const std::unique_ptr<FeatureNetwork> network = files.Load();
    ASSERT_TRUE(network->hasMemoryDataInput());
    EXPECT_EQ(network->outputName(), "copy");
    const cv::Mat image = RandomImage(8, 10, CV_8UC3, 11);
    const std::vector<float> output = network->Forward(image);
    const cv::Mat expected = HandBlob(image, 5, {10, 20, 30}, 0.5f);
    ASSERT_EQ(output.size(), expected.total());
    EXPECT_EQ(std::memcmp(output.data(), expected.ptr<float>(), output.size() * sizeof(float)), 0);
}

TEST(FeatureNetwork, FixtureNetworkGivesTheHandComputedFeature) {
    const cv::Mat image = RandomImage(256, 256, CV_8UC3, 5);
    NetworkOptions variants[5];
    variants[1].meanValues = {120.0f};
    variants[1].writeScale = false;
    variants[2].reluOnOutput = true;
    variants[3].meanFile = true;
    variants[4].memoryData = false;
    for (const NetworkOptions& options : variants) {
        TempNetwork files;
        fixtures::WriteFixtureNetwork(files.folder, options);
        const std::unique_ptr<FeatureNetwork> network = files.Load();
        EXPECT_EQ(network->hasMemoryDataInput(), options.memoryData);
        EXPECT_EQ(network->outputName(), "fc512");
        EXPECT_EQ(network->outputLayer(), options.reluOnOutput ? "relu" : "fc512");
        const std::vector<float> feature = network->Forward(image);
        ExpectClose(feature, fixtures::ExpectedFeature(options, image));
        if (options.reluOnOutput) {
            size_t clipped = 0;
            for (float value : feature) clipped += value == 0.0f;
            EXPECT_GT(clipped, 0u);
        }
    }
    // A uniform colour, the helper other tests use to place cluster centres.
    TempNetwork files;
    fixtures::WriteFixtureNetwork(files.folder, NetworkOptions());
    const cv::Vec3b colour(30, 140, 220);
    ExpectClose(files.Load()->Forward(cv::Mat(256, 256, CV_8UC3, cv::Scalar(30, 140, 220))),
                fixtures::ExpectedFeatureForColour(NetworkOptions(), colour));
}

TEST(FeatureNetwork, OutputFollowsTheDnnModulesLayerNames) {
    // The output is written last by an in-place layer whose name repeats an
    // earlier one: the dnn module calls it "scale_1".
    TempNetwork files;
    fixtures::WriteNetworkFiles(files.folder, std::string(kMemoryDataLayer) + R"(
layer { name: "scale" type: "Pooling" bottom: "data" top: "avg" pooling_param { pool: AVE global_pooling: true } }
layer { name: "scale" type: "Power" bottom: "avg" top: "avg" power_param { scale: 3 } }
layer { name: "other" type: "Pooling" bottom: "data" top: "zmax" pooling_param { pool: MAX global_pooling: true } })",
                                {});
    const std::unique_ptr<FeatureNetwork> network = files.Load();
    EXPECT_EQ(network->outputName(), "avg");
    EXPECT_EQ(network->outputLayer(), "scale_1");
    const cv::Mat image = RandomImage(8, 10, CV_8UC3, 2);
    const cv::Mat blob = HandBlob(image, 5, {10, 20, 30}, 0.5f);
    const std::vector<float> output = network->Forward(image);
    ASSERT_EQ(output.size(), 3u);
    for (int c = 0; c < 3; ++c) {
        double sum = 0.0;
        for (int i = 0; i < 25; ++i) sum += blob.ptr<float>(0, c)[i];
        EXPECT_NEAR(output[static_cast<size_t>(c)], 3.0 * sum / 25.0, 1e-4) << c;
    }
}

TEST(FeatureNetwork, MissingOrBrokenFilesThrowTheDnnException) {
    using Files = NetworkOptions::Files;
    for (Files kind : {Files::None, Files::MissingDefinition, Files::MissingWeights, Files::GarbledDefinition,
                       Files::GarbledWeights}) {
        TempNetwork files;
        NetworkOptions options;
        options.files = kind;
        fixtures::WriteFixtureNetwork(files.folder, options);
        EXPECT_THROW(files.Load(), cv::Exception) << static_cast<int>(kind);
    }
}

// BlobProto with the old num/channels/height/width fields and unpacked floats.
std::string LegacyBlob(int num, int channels, int height, int width, const std::vector<float>& data) {
    std::string bytes;
    const int counts[4] = {num, channels, height, width};
    for (int field = 1; field <= 4; ++field) {
        bytes.push_back(static_cast<char>(field << 3));
        bytes.push_back(static_cast<char>(counts[field - 1]));  // small values: one varint byte
    }
    for (float value : data) {
        bytes.push_back(static_cast<char>((5 << 3) | 5));
        bytes.append(reinterpret_cast<const char*>(&value), sizeof value);
    }
    return bytes;
}

TEST(FeatureNetwork, ReadsMeanBlobsInBothLayouts) {
    TempNetwork files;
    std::vector<float> values(2 * 3 * 4);
    for (size_t i = 0; i < values.size(); ++i) values[i] = 0.25f * static_cast<float>(i);

    fixtures::WriteBytes(files.folder + "legacy", LegacyBlob(1, 2, 3, 4, values));
    WeightsBlob shaped;
    shaped.shape = {1, 2, 3, 4};
    shaped.data = values;
    fixtures::WriteBytes(files.folder + "shaped", SerializeBlob(shaped));
    for (const char* name : {"legacy", "shaped"}) {
        const cv::Mat mean = ReadMeanBlob(files.folder + name, 2, 3, 4);
        ASSERT_EQ(mean.dims, 3);
        EXPECT_EQ(mean.ptr<float>(1, 2)[3], values.back()) << name;
        EXPECT_EQ(mean.ptr<float>(0, 1)[2], values[6]) << name;
    }
    EXPECT_THROW(ReadMeanBlob(files.folder + "shaped", 3, 3, 4), cv::Exception);  // wrong size
    fixtures::WriteBytes(files.folder + "short", LegacyBlob(1, 2, 3, 4, {1.0f}));
    EXPECT_THROW(ReadMeanBlob(files.folder + "short", 2, 3, 4), cv::Exception);  // too few values
    fixtures::WriteBytes(files.folder + "cut", SerializeBlob(shaped).substr(0, 20));
    EXPECT_THROW(ReadMeanBlob(files.folder + "cut", 2, 3, 4), cv::Exception);
    EXPECT_THROW(ReadMeanBlob(files.folder + "absent", 2, 3, 4), cv::Exception);
}

}  // namespace
}  // namespace vora
