// The exported interface end to end on small fixture models: the four compute
// forms, apply, the plain functions and the refusals of input outside the contract.
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <cstring>
#include <numeric>
#include <unistd.h>

#include <opencv2/core.hpp>
#include <opencv2/imgproc.hpp>

#include <vora/vora.h>

#include "color/WorkingOrder.h"
#include "model/StyleDatabase.h"
#include "support/ModelFixtures.h"
#include "support/TestImages.h"
#include "transfer/ColourStatistics.h"

namespace vora {
namespace {

using fixtures::FixtureOptions;
using fixtures::ModelFixture;
using testimages::ImageHandle;
using testimages::SameRecord;
using testimages::SyntheticPhotoRgb;

ColourStats StatsOf(cv::Mat& rgb) {
    ImageHandle image(rgb);
    const cv::Mat bgr = ToWorkingOrder(image.get());
    cv::Mat lab(bgr.rows, bgr.cols, CV_32FC3);
    ConvertToLab(bgr, lab);
    ColourStats stats{};
    ComputeChromaStats(lab, stats);
    ComputeLightnessStats(lab, stats);
    return stats;
}

class Facade : public testing::Test {
protected:
    Facade() : options(fixtures::RandomDatabase(4, 16)), photo(SyntheticPhotoRgb(120, 160)) {}
    FixtureOptions options;
    cv::Mat photo;
};

TEST_F(Facade, ProposalsComeFromTheNearestClusterInScoreOrder) {
    // A uniform colour lands exactly on centre 2.
    const cv::Vec3b bgr(40, 90, 200);
    options.centres[2] = fixtures::CentreFromFeature(fixtures::ExpectedFeatureForColour(options.network, bgr));
    ModelFixture model(options);
    vora_api api(model.modelDir());

    cv::Mat uniform(60, 80, CV_8UC3, cv::Scalar(bgr[2], bgr[1], bgr[0]));  // R, G, B
    ImageHandle content(uniform);
    VoraParameters params;
    params.numTransfers = 3;
    params.rankingFactor = 0.0f;  // no diversity filter: the three best scores
    std::vector<TRANSFER> out(3);
    ASSERT_EQ(api.compute_transfers(content.get(), out, params), STATUS_OK);

    std::vector<int> order(16);
    std::iota(order.begin(), order.end(), 0);
    const std::vector<float>& scores = options.scores[2];
    std::stable_sort(order.begin(), order.end(), [&](int a, int b) { return scores[a] > scores[b]; });
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(out[i].clusterIndex, 2);
        EXPECT_EQ(out[i].styleIndex, order[i]);
        EXPECT_EQ(out[i].toneCurve[0], 0.0f);
        EXPECT_EQ(out[i].toneCurve[255], 1.0f);
        EXPECT_EQ(out[i].toneCurve[256], 1.0f);
    }
}

TEST_F(Facade, AllComputeFormsAgree) {
    ModelFixture model(options);
    vora_api api(model.modelDir());
    ImageHandle content(photo);
    VoraParameters params;  // five proposals
    const CFaceRect faces[] = {CFaceRect(0.3, 0.5, 0.25, 0.55)};
    params.faceRects = faces;
    params.numFaceRects = 1;

    std::vector<TRANSFER> vectorForm(7);
    vectorForm[5].styleIndex = 1234;  // beyond numTransfers: left alone
    ASSERT_EQ(api.compute_transfers(content.get(), vectorForm, params), STATUS_OK);
    EXPECT_EQ(vectorForm[5].styleIndex, 1234);
    EXPECT_EQ(vectorForm[6].styleIndex, 0);

    TRANSFER arrayForm[5];
    ASSERT_EQ(api.compute_transfers(content.get(), arrayForm, params), STATUS_OK);
    TRANSFER plainForm[5];
    ASSERT_EQ(compute_transfers(&api, content.get(), plainForm, &params), STATUS_OK);
    for (int i = 0; i < 5; ++i) {
        EXPECT_TRUE(SameRecord(vectorForm[i], arrayForm[i])) << i;
        EXPECT_TRUE(SameRecord(vectorForm[i], plainForm[i])) << i;
        EXPECT_LE(arrayForm[i].faceCorrections.size(), 1u);
    }

    // The dark face of the synthetic photo gets lifted by at least one proposal.
    EXPECT_TRUE(std::any_of(arrayForm, arrayForm + 5, [](const TRANSFER& t) { return !t.faceCorrections.empty(); }));

    // A named style gives the same solve, with the driver's indices and no faces.
    TRANSFER named;
    named.faceCorrections.resize(2);
    ASSERT_EQ(api.compute_transfer(content.get(), vectorForm[0].styleIndex, named, params), STATUS_OK);
    EXPECT_EQ(named.clusterIndex, -1);
    EXPECT_EQ(named.styleIndex, vectorForm[0].styleIndex);
    EXPECT_EQ(named.faceCorrections.size(), 2u);  // left as the caller passed it
    EXPECT_EQ(std::memcmp(named.chromaMatrix, vectorForm[0].chromaMatrix, sizeof named.chromaMatrix), 0);
    EXPECT_EQ(std::memcmp(named.toneCurve, vectorForm[0].toneCurve, sizeof named.toneCurve), 0);
}

TEST_F(Facade, StyleImageAndItsDatabaseRecordGiveTheSameTransfer) {
    cv::Mat styleImage = SyntheticPhotoRgb(90, 70, 99);  // a different size from the content
    ColourStats record = StatsOf(styleImage);
    record.lightnessLow = record.lightnessHigh = 0.0f;  // not stored in the database
    options.styles[12] = record;
    ModelFixture model(options);
    vora_api api(model.modelDir());
    ImageHandle content(photo), style(styleImage);
    VoraParameters params;
    params.solveFactor = 0.7f;
    params.limitFactor = 0.5f;

    TRANSFER fromImage, fromIndex;
    ASSERT_EQ(api.compute_transfer(content.get(), style.get(), fromImage, params), STATUS_OK);
    ASSERT_EQ(api.compute_transfer(content.get(), 12, fromIndex, params), STATUS_OK);
    EXPECT_EQ(fromImage.clusterIndex, -1);
    EXPECT_EQ(fromImage.styleIndex, -1);
    EXPECT_EQ(fromIndex.clusterIndex, -1);
    EXPECT_EQ(fromIndex.styleIndex, 12);
    fromIndex.styleIndex = -1;
    EXPECT_TRUE(SameRecord(fromImage, fromIndex));
}

TEST_F(Facade, ApplyMemberAndPlainFunctionGiveTheSameBytes) {
    ModelFixture model(options);
    vora_api api(model.modelDir());
    ImageHandle content(photo);
    VoraParameters params;
    params.numTransfers = 1;
    std::vector<TRANSFER> out(1);
    ASSERT_EQ(api.compute_transfers(content.get(), out, params), STATUS_OK);

    cv::Mat a = photo.clone(), b = photo.clone();
    ImageHandle da(a), db(b);
    ASSERT_EQ(api.apply_transfer(content.get(), out[0], da.get()), STATUS_OK);
    ASSERT_EQ(apply_transfer(&api, content.get(), &out[0], db.get()), STATUS_OK);
    EXPECT_EQ(cv::norm(a, b, cv::NORM_INF), 0.0);
    EXPECT_GT(cv::norm(a, photo, cv::NORM_INF), 0.0);
}

TEST_F(Facade, PlaceholdersChangeNothing) {
    ModelFixture model(options);
    vora_api api(model.modelDir());
    ImageHandle content(photo);
    VoraParameters params;
    std::vector<TRANSFER> before(5), after(5);
    ASSERT_EQ(api.compute_transfers(content.get(), before, params), STATUS_OK);

    int index = -7;
    EXPECT_EQ(api.add_style(content.get(), index), STATUS_OK);
    EXPECT_EQ(index, -7);
    EXPECT_EQ(api.remove_style(7), STATUS_OK);
    EXPECT_EQ(api.customize_style_preference({}), STATUS_OK);
    EXPECT_EQ(api.customize_style_preference({3, 1}), STATUS_OK);

    ASSERT_EQ(api.compute_transfers(content.get(), after, params), STATUS_OK);
    for (int i = 0; i < 5; ++i) EXPECT_TRUE(SameRecord(before[i], after[i])) << i;
}

TEST_F(Facade, DefaultConstructorReadsTheModelBelowTheWorkingDirectory) {
    ModelFixture model(options);
    char previous[4096];
    ASSERT_NE(getcwd(previous, sizeof previous), nullptr);
    ASSERT_EQ(chdir(model.root().c_str()), 0);
    std::vector<TRANSFER> out(5);
    Status status = STATUS_INVALID_ARGUMENT;
    {
        vora_api api;  // "./model/"
        ImageHandle content(photo);
        status = api.compute_transfers(content.get(), out, VoraParameters());
    }
    ASSERT_EQ(chdir(previous), 0);
    EXPECT_EQ(status, STATUS_OK);
}

TEST_F(Facade, PlainLifecycle) {
    ModelFixture model(options);
    DestroyVoraObj(nullptr);
    vora_api* api = CreateVoraObj(model.modelDir().c_str());
    ASSERT_NE(api, nullptr);
    ImageHandle content(photo);
    TRANSFER out[5];
    EXPECT_EQ(compute_transfers(api, content.get(), out, nullptr), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(compute_transfers(nullptr, content.get(), out, nullptr), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(apply_transfer(api, content.get(), nullptr, content.get()), STATUS_INVALID_ARGUMENT);
    DestroyVoraObj(api);
}

// Every refusal returns promptly and writes nothing.
class Refusals : public Facade {
protected:
    Status Compute(const std::string& dir, uint64_t n = 5, std::vector<TRANSFER>* keep = nullptr) {
        vora_api api(dir);
        ImageHandle content(photo);
        VoraParameters params;
        params.numTransfers = n;
        std::vector<TRANSFER> out(n + 1);
        for (TRANSFER& t : out) t.styleIndex = 777;
        const Status status = api.compute_transfers(content.get(), out, params);
        if (status != STATUS_OK) {
            for (const TRANSFER& t : out) EXPECT_EQ(t.styleIndex, 777);
        }
        if (keep) *keep = out;
        return status;
    }
};

TEST_F(Refusals, MissingOrRejectedDataFiles) {
    const auto started = std::chrono::steady_clock::now();
    for (int missing = 0; missing < 4; ++missing) {
        FixtureOptions broken = options;
        broken.writeClusters = missing != 0;
        broken.writeStyles = missing != 1;
        broken.writeScores = missing != 2;
        broken.writeDistances = missing != 3;
        ModelFixture model(broken);
        EXPECT_EQ(Compute(model.modelDir()), STATUS_MODEL_INCOMPLETE) << missing;
    }
    FixtureOptions transposed = fixtures::RandomDatabase(3, 5);
    transposed.transposeScores = true;
    ModelFixture rejected(transposed);
    EXPECT_EQ(Compute(rejected.modelDir()), STATUS_MODEL_INCOMPLETE);

    FixtureOptions empty = fixtures::RandomDatabase(0, 0);
    ModelFixture emptyModel(empty);
    EXPECT_EQ(Compute(emptyModel.modelDir()), STATUS_MODEL_INCOMPLETE);
    EXPECT_LT(std::chrono::steady_clock::now() - started, std::chrono::seconds(20));
}

TEST_F(Refusals, AFacadeWithoutDataStillComputesTowardAStyleImage) {
    FixtureOptions none = options;
    none.writeClusters = none.writeStyles = none.writeScores = none.writeDistances = false;
    ModelFixture model(none);
    vora_api api(model.modelDir());
    ImageHandle content(photo);
    TRANSFER out;
    EXPECT_EQ(api.compute_transfer(content.get(), content.get(), out, VoraParameters()), STATUS_OK);
    EXPECT_EQ(api.compute_transfer(content.get(), 0, out, VoraParameters()), STATUS_STYLE_INDEX_OUT_OF_RANGE);
}

TEST_F(Refusals, SelectionsThatCouldNeverFinish) {
    ModelFixture single(fixtures::RandomDatabase(2, 1));  // one style column keeps no style
    EXPECT_EQ(Compute(single.modelDir()), STATUS_NO_USABLE_STYLE);

    ModelFixture model(options);
    EXPECT_EQ(Compute(model.modelDir(), 0), STATUS_NO_TRANSFERS_REQUESTED);
    {
        vora_api api(model.modelDir());
        ImageHandle content(photo);
        TRANSFER out[1];
        VoraParameters params;
        params.numTransfers = 0;
        EXPECT_EQ(api.compute_transfers(content.get(), out, params), STATUS_NO_TRANSFERS_REQUESTED);
    }
    // Fewer valid styles than asked for: repeated styles, not a hang.
    std::vector<TRANSFER> out;
    ModelFixture two(fixtures::RandomDatabase(2, 4));  // two valid styles per cluster
    ASSERT_EQ(Compute(two.modelDir(), 5, &out), STATUS_OK);
    for (int i = 0; i < 5; ++i) EXPECT_EQ(out[i].styleIndex, out[i % 2].styleIndex) << i;
}

TEST_F(Refusals, BadArguments) {
    ModelFixture model(options);
    vora_api api(model.modelDir());
    ImageHandle content(photo);
    VoraParameters params;
    std::vector<TRANSFER> shortVector(4);
    EXPECT_EQ(api.compute_transfers(content.get(), shortVector, params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(api.compute_transfers(nullptr, shortVector, params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(api.compute_transfers(content.get(), static_cast<TRANSFER*>(nullptr), params),
              STATUS_INVALID_ARGUMENT);
    TRANSFER one;
    for (int index : {-1, 16, 1 << 30}) {
        EXPECT_EQ(api.compute_transfer(content.get(), index, one, params), STATUS_STYLE_INDEX_OUT_OF_RANGE);
    }
    EXPECT_EQ(api.compute_transfer(content.get(), static_cast<const IImage*>(nullptr), one, params),
              STATUS_INVALID_ARGUMENT);
    int index = 3;
    EXPECT_EQ(api.add_style(nullptr, index), STATUS_INVALID_ARGUMENT);

    // A count of faces without an array means no faces.
    params.numFaceRects = 3;
    TRANSFER records[5];
    EXPECT_EQ(api.compute_transfers(content.get(), records, params), STATUS_OK);
    for (const TRANSFER& t : records) EXPECT_TRUE(t.faceCorrections.empty());
}

TEST_F(Refusals, DependencyErrorsPassAsExceptions) {
    ModelFixture model(options);
    vora_api api(model.modelDir());
    const size_t layout[4] = {};
    IImage* noPixels = CreateImageObj(10, 10, 3, layout, nullptr, CFullResImageSize(10, 10), CTopLeftCoordinate());
    std::vector<TRANSFER> out(5);
    EXPECT_THROW(api.compute_transfers(noPixels, out, VoraParameters()), cv::Exception);
    DestroyImageObj(noPixels);

    FixtureOptions noNetwork = options;
    noNetwork.network.files = fixtures::NetworkOptions::Files::None;
    ModelFixture broken(noNetwork);
    EXPECT_THROW(vora_api{broken.modelDir()}, cv::Exception);
    EXPECT_THROW(CreateVoraObj(broken.modelDir().c_str()), cv::Exception);
}

}  // namespace
}  // namespace vora
