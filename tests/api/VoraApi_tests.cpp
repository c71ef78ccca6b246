// The exported interface end to end on small fixture models: the compute forms
// agree, apply gives the same bytes as member or plain function, the example
// host renders, and broken networks are refused at construction.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <string>

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include "api/ApiFixture.h"
#include "transfer/ColourStatistics.h"

namespace vora {
namespace {

using fixtures::ModelFixture;
using testimages::ImageHandle;
using testimages::SameRecord;

class VoraApi : public ApiTest {};

// Vector, array and plain forms agree (records past numTransfers untouched), the
// placeholder add_style in between reads the image and changes nothing (the other
// two placeholders only return STATUS_OK), apply gives the same bytes as member or
// plain function, and a style image solves as its database record does.
TEST_F(VoraApi, AllFormsAgree) {
    cv::Mat styleImage = testimages::SyntheticPhotoRgb(90, 70, 99);  // not the content's size
    const ImageHandle style(styleImage);
    ColourStats& record = options.styles[12] = ColourStats{};
    SummariseColours(styleImage, ChannelOrder::Rgb, record);
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
TEST_F(VoraApi, ExampleHostAndDefaultConstructorGiveTheSameBytes) {
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

// Broken network files, an empty weights file or a folder in its place among
// them, throw out of the constructor as the libraries' own exceptions, not
// out of the first compute; the sanitizer build checks for leaks.
TEST_F(VoraApi, BrokenNetworkFilesAreRefusedAtConstruction) {
    using Files = fixtures::NetworkOptions::Files;
    for (Files files : {Files::None, Files::MissingWeights, Files::GarbledDefinition, Files::GarbledWeights,
                        Files::EmptyWeights, Files::WeightsFolder}) {
        options.network.files = files;
        const ModelFixture broken(options);
        EXPECT_THROW(vora_api{broken.modelDir()}, cv::Exception) << static_cast<int>(files);
        EXPECT_THROW(CreateVoraObj(broken.modelDir().c_str()), cv::Exception) << static_cast<int>(files);
    }
}

}  // namespace
}  // namespace vora
