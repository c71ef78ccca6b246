// The exported interface end to end on small fixture models: the compute forms,
// apply, the plain functions, the example host and the refusals.
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <limits>
#include <string>

#include <opencv2/core.hpp>
#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include <vora/vora.h>

#include "color/WorkingOrder.h"
#include "model/FeatureNetwork.h"
#include "support/ModelFixtures.h"
#include "support/TestImages.h"
#include "transfer/ColourStatistics.h"

namespace vora {
namespace {

using fixtures::FixtureOptions;
using fixtures::ModelFixture;
using testimages::ImageHandle;
using testimages::SameRecord;

class Facade : public testing::Test {
protected:
    FixtureOptions options = fixtures::RandomDatabase(4, 16);
    cv::Mat photo = testimages::SyntheticPhotoRgb(120, 160);
    ImageHandle content{photo};
    VoraParameters params;
};

// The model is read whole at construction, so its folder may go afterwards.
vora_api Api(const FixtureOptions& options) {
    const ModelFixture model(options);
    return vora_api(model.modelDir());
}

TEST_F(Facade, ProposalsComeFromTheNearestClusterInScoreOrder) {
    // A uniform image of this colour (R, G, B) lands exactly on centre 2.
    const std::vector<float> feature =
        fixtures::ExpectedFeature(options.network, cv::Mat(256, 256, CV_8UC3, cv::Scalar(40, 90, 200)));
    std::copy_n(feature.begin(), 512, options.centres[2].begin());
    cv::Mat uniform(60, 80, CV_8UC3, cv::Scalar(200, 90, 40));
    const ImageHandle image(uniform);
    params.numTransfers = 3;
    params.rankingFactor = 0.0f;  // no diversity filter: the three best scores
    std::vector<TRANSFER> out(3);
    ASSERT_EQ(Api(options).compute_transfers(image.get(), out, params), STATUS_OK);
    std::vector<float> best = options.scores[2];
    std::sort(best.rbegin(), best.rend());
    for (int i = 0; i < 3; ++i)
        EXPECT_TRUE(out[i].clusterIndex == 2 && options.scores[2].at(out[i].styleIndex) == best[i]) << i;
}

// Vector, array and plain forms agree (records past numTransfers untouched), the
// placeholders in between change nothing, apply gives the same bytes as member or
// plain function, and a style image solves as its database record does.
TEST_F(Facade, AllFormsAgree) {
    cv::Mat styleImage = testimages::SyntheticPhotoRgb(90, 70, 99);  // not the content's size
    const ImageHandle style(styleImage);
    cv::Mat lab(styleImage.size(), CV_32FC3);
    ConvertToLab(ToWorkingOrder(style.get()), lab);
    ColourStats& record = options.styles[12] = ColourStats{};
    ComputeChromaStats(lab, record);
    ComputeLightnessStats(lab, record);
    record.lightnessLow = record.lightnessHigh = 0.0f;  // not stored in the database
    vora_api api = Api(options);
    const CFaceRect faces[] = {CFaceRect(0.3, 0.5, 0.25, 0.55)};
    params.faceRects = faces;
    params.numFaceRects = 1;
    std::vector<TRANSFER> vectorForm(6);
    vectorForm[5].styleIndex = 1234;
    ASSERT_EQ(api.compute_transfers(content.get(), vectorForm, params), STATUS_OK);
    EXPECT_EQ(vectorForm[5].styleIndex, 1234);
    int index = -7;
    EXPECT_TRUE(api.add_style(content.get(), index) == STATUS_OK && index == -7);
    EXPECT_TRUE(api.remove_style(7) == STATUS_OK && api.customize_style_preference({3, 1}) == STATUS_OK);
    TRANSFER arrayForm[5], plainForm[5];
    ASSERT_EQ(api.compute_transfers(content.get(), arrayForm, params), STATUS_OK);
    ASSERT_EQ(compute_transfers(&api, content.get(), plainForm, &params), STATUS_OK);
    for (int i = 0; i < 5; ++i)
        EXPECT_TRUE(SameRecord(vectorForm[i], arrayForm[i]) && SameRecord(vectorForm[i], plainForm[i])) << i;
    // The dark face of the synthetic photo gets lifted by at least one proposal.
    EXPECT_TRUE(std::any_of(arrayForm, arrayForm + 5, [](const TRANSFER& t) { return !t.faceCorrections.empty(); }));

    cv::Mat a = photo.clone(), b = photo.clone();
    const ImageHandle imageA(a), imageB(b);
    ASSERT_EQ(api.apply_transfer(content.get(), arrayForm[0], imageA.get()), STATUS_OK);
    ASSERT_EQ(apply_transfer(&api, content.get(), &arrayForm[0], imageB.get()), STATUS_OK);
    EXPECT_EQ(cv::norm(a, b, cv::NORM_INF), 0.0);
    EXPECT_GT(cv::norm(a, photo, cv::NORM_INF), 0.0);

    params.solveFactor = 0.7f;
    params.limitFactor = 0.5f;
    TRANSFER fromImage, fromIndex;
    ASSERT_EQ(api.compute_transfer(content.get(), style.get(), fromImage, params), STATUS_OK);
    ASSERT_EQ(api.compute_transfer(content.get(), 12, fromIndex, params), STATUS_OK);
    EXPECT_TRUE(fromImage.clusterIndex == -1 && fromImage.styleIndex == -1 && fromIndex.styleIndex == 12);
    fromIndex.styleIndex = -1;
    EXPECT_TRUE(SameRecord(fromImage, fromIndex));
}

// The example host renders the first proposal tile by tile; the default
// constructor, run in the model's parent folder, reads "./model/".
TEST_F(Facade, ExampleHostAndDefaultConstructorGiveTheSameBytes) {
    ModelFixture model(options);
    const std::string photoPath = model.root() + "/photo.png", outPath = model.root() + "/out.png";
    cv::Mat bgr;
    cv::cvtColor(photo, bgr, cv::COLOR_RGB2BGR);
    ASSERT_TRUE(cv::imwrite(photoPath, bgr));
    const std::string command = std::string(VORA_EXAMPLE_HOST) + " '" + model.modelDir() + "' '" + photoPath + "' '" +
                                outPath + "' 37 > /dev/null";
    ASSERT_EQ(std::system(command.c_str()), 0);
    const std::filesystem::path previous = std::filesystem::current_path();
    std::filesystem::current_path(model.root());
    vora_api api;
    std::filesystem::current_path(previous);
    params.numTransfers = 3;  // as the host asks
    std::vector<TRANSFER> proposals(3);
    ASSERT_EQ(api.compute_transfers(content.get(), proposals, params), STATUS_OK);
    ASSERT_EQ(api.apply_transfer(content.get(), proposals[0], content.get()), STATUS_OK);
    cv::cvtColor(photo, bgr, cv::COLOR_RGB2BGR);
    EXPECT_EQ(cv::norm(cv::imread(outPath, cv::IMREAD_COLOR), bgr, cv::NORM_INF), 0.0);
}

// Every refusal returns promptly and writes nothing.
class Refusals : public Facade {
protected:
    Status Compute(const FixtureOptions& database, uint64_t n = 5, std::vector<TRANSFER>* keep = nullptr) {
        vora_api api = Api(database);
        params.numTransfers = n;
        std::vector<TRANSFER> out(n + 1);
        for (TRANSFER& t : out) t.styleIndex = 777;
        const Status status = api.compute_transfers(content.get(), out, params);
        for (const TRANSFER& t : out) EXPECT_TRUE(status == STATUS_OK || t.styleIndex == 777);
        if (keep) *keep = out;
        return status;
    }
};

TEST_F(Refusals, ModelsAndSelectionsThatCannotServe) {
    const auto started = std::chrono::steady_clock::now();
    // Each data file missing, or the scores transposed.
    for (bool FixtureOptions::*flag : {&FixtureOptions::writeClusters, &FixtureOptions::writeStyles,
                                       &FixtureOptions::writeScores, &FixtureOptions::writeDistances,
                                       &FixtureOptions::transposeScores}) {
        FixtureOptions broken = options;
        broken.*flag = !(broken.*flag);
        EXPECT_EQ(Compute(broken), STATUS_MODEL_INCOMPLETE);
    }
    EXPECT_EQ(Compute(fixtures::RandomDatabase(0, 0)), STATUS_MODEL_INCOMPLETE);
    EXPECT_EQ(Compute(fixtures::RandomDatabase(2, 1)), STATUS_NO_USABLE_STYLE);  // one column keeps no style
    EXPECT_EQ(Compute(options, 0), STATUS_NO_TRANSFERS_REQUESTED);
    EXPECT_LT(std::chrono::steady_clock::now() - started, std::chrono::seconds(20));
    // Two valid styles per cluster, the rest -1: five proposals repeat them, not a hang.
    std::vector<TRANSFER> out;
    ASSERT_EQ(Compute(fixtures::RandomDatabase(2, 4), 5, &out), STATUS_OK);
    for (int i = 0; i < 5; ++i) EXPECT_EQ(out[i].styleIndex, out[i % 2].styleIndex) << i;
}

// Style records holding NaN or infinity would solve to non-finite transfers:
// every compute form refuses them and leaves the caller's record as it was.
TEST_F(Refusals, NonFiniteStyleRecordsGiveNoTransfer) {
    for (const float bad : {std::numeric_limits<float>::quiet_NaN(), std::numeric_limits<float>::infinity()}) {
        FixtureOptions database = fixtures::RandomDatabase(2, 4);
        for (ColourStats& style : database.styles) style.chromaSqrtCov[1] = bad;
        EXPECT_EQ(Compute(database), STATUS_NON_FINITE_RESULT);
        vora_api api = Api(database);
        TRANSFER one;
        one.styleIndex = 777;
        EXPECT_EQ(api.compute_transfer(content.get(), 2, one, params), STATUS_NON_FINITE_RESULT);
        EXPECT_EQ(one.styleIndex, 777);
    }
}

TEST_F(Refusals, BadArgumentsAndDependencyErrors) {
    ModelFixture model(options);
    vora_api api(model.modelDir());
    std::vector<TRANSFER> shortVector(4);
    TRANSFER one, records[5];
    EXPECT_EQ(api.compute_transfers(content.get(), shortVector, params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(api.compute_transfers(nullptr, shortVector, params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(api.compute_transfers(content.get(), static_cast<TRANSFER*>(nullptr), params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(api.compute_transfer(content.get(), static_cast<const IImage*>(nullptr), one, params),
              STATUS_INVALID_ARGUMENT);
    for (int index : {-1, 16, 1 << 30})
        EXPECT_EQ(api.compute_transfer(content.get(), index, one, params), STATUS_STYLE_INDEX_OUT_OF_RANGE);
    int index = 3;
    EXPECT_EQ(api.add_style(nullptr, index), STATUS_INVALID_ARGUMENT);
    params.numFaceRects = 3;  // a count of faces without an array means no faces
    EXPECT_EQ(api.compute_transfers(content.get(), records, params), STATUS_OK);
    for (const TRANSFER& t : records) EXPECT_TRUE(t.faceCorrections.empty());

    // The plain functions: lifecycle and null arguments.
    DestroyVoraObj(nullptr);
    vora_api* plain = CreateVoraObj(model.modelDir().c_str());
    ASSERT_NE(plain, nullptr);
    EXPECT_EQ(compute_transfers(plain, content.get(), records, nullptr), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(compute_transfers(nullptr, content.get(), records, &params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(apply_transfer(plain, content.get(), nullptr, content.get()), STATUS_INVALID_ARGUMENT);
    DestroyVoraObj(plain);

    // Broken network files throw out of the constructor as the libraries' own
    // exceptions; the sanitizer build checks for leaks.
    using Files = fixtures::NetworkOptions::Files;
    for (Files files : {Files::None, Files::MissingWeights, Files::GarbledDefinition, Files::GarbledWeights}) {
        options.network.files = files;
        const ModelFixture broken(options);
        EXPECT_THROW(vora_api{broken.modelDir()}, cv::Exception);
        EXPECT_THROW(CreateVoraObj(broken.modelDir().c_str()), cv::Exception);
    }
    // An empty weights file, or a directory in its place, is refused by the
    // constructor too, not by the first compute.
    options.network.files = Files::Valid;
    for (const bool directory : {false, true}) {
        const ModelFixture broken(options);
        const std::string weights = broken.modelDir() + kNetworkFolder + kNetworkWeightsName;
        std::filesystem::remove(weights);
        if (directory)
            std::filesystem::create_directory(weights);
        else
            fixtures::WriteBytes(weights, "");
        EXPECT_THROW(vora_api{broken.modelDir()}, cv::Exception) << directory;
    }
}

}  // namespace
}  // namespace vora
