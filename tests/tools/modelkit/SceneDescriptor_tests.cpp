#include "modelkit/SceneDescriptor.h"

#include <cmath>
#include <filesystem>

#include <gtest/gtest.h>
#include <opencv2/imgproc.hpp>

#include "model/FeatureNetwork.h"
#include "semantic/NetworkInput.h"

namespace fs = std::filesystem;
using namespace vora;
using namespace vora::modelkit;

namespace {

struct TempDir {
    fs::path path;
    TempDir() {
        path = fs::temp_directory_path() / ("vora_descriptor_" + std::to_string(::getpid()) + "_" +
                                            ::testing::UnitTest::GetInstance()->current_test_info()->name());
        fs::remove_all(path);
        fs::create_directories(path);
    }
    ~TempDir() { fs::remove_all(path); }
};

std::unique_ptr<FeatureNetwork> LoadWritten(const NetworkFiles& files, const fs::path& dir) {
    WriteNetworkFiles(files, dir.string());
    return FeatureNetwork::Load((dir / kNetworkDefinitionName).string(), (dir / kNetworkWeightsName).string());
}

std::vector<float> Describe(FeatureNetwork& net, const cv::Mat& bgr8) {
    cv::Mat canvas;
    EXPECT_TRUE(PrepareNetworkImage(bgr8, canvas, kNetworkImageSize, kNetworkInputSize));
    return net.Forward(canvas);
}

cv::Mat Noise(int rows, int cols, uint64_t seed) {
    cv::Mat image(rows, cols, CV_8UC3);
    cv::RNG rng(seed);
    rng.fill(image, cv::RNG::UNIFORM, 0, 256);
    cv::GaussianBlur(image, image, cv::Size(0, 0), 2.0);
    return image;
}

}  // namespace

TEST(SceneDescriptor, PooledNetworkRunsAndMeasuresColour) {
    TempDir dir;
    auto net = LoadWritten(PooledFeatureNetwork(), dir.path);
    EXPECT_TRUE(net->hasMemoryDataInput());
    EXPECT_EQ(net->outputName(), kFeaturesTop);

    // Mid-grey is zero after the input transform: no texture, no colour.
    const std::vector<float> grey = Describe(*net, cv::Mat(300, 400, CV_8UC3, cv::Scalar(128, 128, 128)));
    ASSERT_EQ(grey.size(), static_cast<size_t>(PooledFeatureSize()));
    for (float v : grey) EXPECT_FLOAT_EQ(v, 0.0f);

    // A flat colour: the colour layout holds its opponent values in every
    // cell (the last 3 x 21 features), whatever the pooling level.
    const cv::Scalar bgr(200, 100, 40);
    const std::vector<float> flat = Describe(*net, cv::Mat(240, 240, CV_8UC3, bgr));
    const float b = (200 - 128) / 128.0f, g = (100 - 128) / 128.0f, r = (40 - 128) / 128.0f;
    const float expected[3] = {(b + g + r) / 3, (r - g) / 2, (r + g) / 4 - b / 2};
    const int colourStart = PooledFeatureSize() - 3 * 21;
    // Order: the 4 x 4 map (channel-major), then 2 x 2, then 1 x 1.
    for (int c = 0; c < 3; ++c) {
        for (int cell = 0; cell < 16; ++cell) EXPECT_NEAR(flat[colourStart + c * 16 + cell], expected[c], 1e-5);
        for (int cell = 0; cell < 4; ++cell) EXPECT_NEAR(flat[colourStart + 48 + c * 4 + cell], expected[c], 1e-5);
        EXPECT_NEAR(flat[colourStart + 60 + c], expected[c], 1e-5);
    }
}

TEST(SceneDescriptor, TextureRespondsToOrientation) {
    TempDir dir;
    auto net = LoadWritten(PooledFeatureNetwork(), dir.path);
    // Vertical stripes, 8 px period at the network's 227 px scale: the finest
    // levels' horizontally tuned filters (orientation 0: the carrier runs
    // along x) respond more than the orientation 90 degrees away.
    cv::Mat stripes(227, 227, CV_8UC3);
    for (int y = 0; y < 227; ++y)
        for (int x = 0; x < 227; ++x)
            stripes.at<cv::Vec3b>(y, x) = cv::Vec3b::all(static_cast<uchar>(128 + 100 * std::sin(2 * CV_PI * x / 8.0)));
    const std::vector<float> f = Describe(*net, stripes);
    // Level 1 (wavelength 8 px) global energies: after the 4 x 4 (6 x 16) and
    // 2 x 2 (6 x 4) maps come the six 1 x 1 values.
    const int level1 = 126;
    const float along = f[level1 + 96 + 24 + 0];
    const float across = f[level1 + 96 + 24 + 3];
    EXPECT_GT(along, 5.0f * across);
}

TEST(SceneDescriptor, ProjectionThroughNetworkMatchesProjectInCode) {
    TempDir dir;
    auto pooledNet = LoadWritten(PooledFeatureNetwork(), dir.path);
    std::vector<cv::Mat> images;
    for (int i = 0; i < 24; ++i) images.push_back(Noise(120 + 7 * i, 160, i + 1));
    cv::Mat pooled(0, PooledFeatureSize(), CV_32F);
    for (const cv::Mat& image : images) pooled.push_back(cv::Mat(Describe(*pooledNet, image)).t());

    const Projection projection = FitProjection(pooled);
    ASSERT_EQ(projection.featureSize, PooledFeatureSize());
    // 24 photos span at most 23 directions: the rest of the rows are zero.
    for (size_t i = 23 * static_cast<size_t>(projection.featureSize); i < projection.weights.size(); ++i)
        ASSERT_EQ(projection.weights[i], 0.0f);

    fs::create_directories(dir.path / "full");
    auto full = LoadWritten(DescriptorNetwork(projection), dir.path / "full");
    EXPECT_EQ(full->outputName(), kDescriptorTop);
    for (int i = 0; i < 3; ++i) {
        const std::vector<float> viaNetwork = Describe(*full, images[i]);
        ASSERT_EQ(viaNetwork.size(), static_cast<size_t>(kDescriptorSize));
        const std::vector<float> inCode = Project(projection, pooled.ptr<float>(i));
        for (int k = 0; k < kDescriptorSize; ++k) EXPECT_NEAR(viaNetwork[k], inCode[k], 1e-3) << k;
    }

    // Whitened components: over the fitted rows each has zero mean and a
    // variance just under one (the damping keeps it below).
    cv::Mat projected(0, kDescriptorSize, CV_32F);
    for (int i = 0; i < pooled.rows; ++i) projected.push_back(cv::Mat(Project(projection, pooled.ptr<float>(i))).t());
    cv::Mat mean, stddev;
    cv::meanStdDev(projected.col(0), mean, stddev);
    EXPECT_NEAR(mean.at<double>(0), 0.0, 1e-3);
    EXPECT_GT(stddev.at<double>(0), 0.9);
    EXPECT_LT(stddev.at<double>(0), 1.0);
}
