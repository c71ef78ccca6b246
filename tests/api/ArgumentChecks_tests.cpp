// The checks at the door: every refusal returns promptly, prints nothing and
// writes nothing, whichever form of the interface the caller uses.
#include <gtest/gtest.h>

#include <iterator>
#include <utility>
#include <vector>

#include "api/ApiFixture.h"

namespace vora {
namespace {

using testimages::ImagePtr;

class ArgumentChecks : public ApiTest {};

TEST_F(ArgumentChecks, ComputeRefusesMissingArgumentsShortRoomAndNoRequest) {
    vora_api api = Api(options);
    std::vector<TRANSFER> shortVector(4), room(5);
    TRANSFER one, records[5];
    EXPECT_EQ(api.compute_transfers(content.get(), shortVector, params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(api.compute_transfers(nullptr, room, params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(api.compute_transfers(content.get(), static_cast<TRANSFER*>(nullptr), params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(api.compute_transfers(nullptr, records, params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(api.compute_transfer(content.get(), static_cast<const IImage*>(nullptr), one, params),
              STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(api.compute_transfer(nullptr, 2, one, params), STATUS_INVALID_ARGUMENT);
    for (int index : {-1, 16, 1 << 30})
        EXPECT_EQ(api.compute_transfer(content.get(), index, one, params), STATUS_STYLE_INDEX_OUT_OF_RANGE);
    int index = 3;
    EXPECT_EQ(api.add_style(nullptr, index), STATUS_INVALID_ARGUMENT);
    // No request outranks a model that cannot serve; a short vector outranks both.
    params.numTransfers = 0;
    EXPECT_EQ(api.compute_transfers(content.get(), records, params), STATUS_NO_TRANSFERS_REQUESTED);
    EXPECT_EQ(Compute(fixtures::RandomDatabase(0, 0), 0), STATUS_NO_TRANSFERS_REQUESTED);

    const fixtures::ModelFixture model(options);
    vora_api* plain = CreateVoraObj(model.modelDir().c_str());
    ASSERT_NE(plain, nullptr);
    EXPECT_EQ(compute_transfers(plain, content.get(), records, nullptr), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(compute_transfers(nullptr, content.get(), records, &params), STATUS_INVALID_ARGUMENT);
    EXPECT_EQ(apply_transfer(plain, content.get(), nullptr, content.get()), STATUS_INVALID_ARGUMENT);
    DestroyVoraObj(plain);
    DestroyVoraObj(nullptr);
}

// Refused geometry writes and prints nothing; an empty source is no error and writes nothing either.
TEST_F(ArgumentChecks, ApplyRefusesGeometryThatWouldEscapeTheBuffers) {
    vora_api api = Api(options);
    cv::Mat source(8, 12, CV_8UC3, cv::Scalar::all(90)), scratch(8, 20 * 4, CV_8U, cv::Scalar(5));
    uint8_t *const in = source.data, *const s = scratch.data;  // every destination points at scratch
    const size_t layout[4] = {};
    // width x height pixels, rows rowPixels apart, starting `top` rows down.
    auto image = [&layout](uint8_t* data, size_t width, size_t height = 8, size_t channels = 3, size_t rowPixels = 12,
                           size_t top = 0) {
        return ImagePtr(GetTileImageObj(height, width, channels, layout, data, {rowPixels, height + top}, {0, top}));
    };
    const std::pair<ImagePtr, ImagePtr> cases[] = {
        {nullptr, image(s, 12)}, {image(in, 12), nullptr}, {image(nullptr, 12), image(s, 12)},
        {image(in, 12), image(nullptr, 12)}, {image(in, 12, 8, 1), image(s, 12, 8, 1)},  // grey
        {image(in, 12, 8, 3, 10), image(s, 12, 8, 3, 10)},  // rows closer than a row of pixels
        {image(in, 12), image(s, 11, 8, 3, 11)}, {image(in, 12), image(s, 12, 7)},  // narrower, shorter
        {image(in, 12), image(s, 12, 8, 3, 20)}, {image(in, 12), image(s, 12, 8, 4, 9)},  // wider rows, wider pixels
        {image(in, 12, 0, 3, 12, 2), image(s, 12)}, {image(in, 0, 8, 3, 12, 1), image(s, 12)}};  // empty: no error
    TRANSFER record;
    record.faceCorrections.resize(1);  // a record with faces would print for a tile at the origin
    for (size_t i = 0; i < std::size(cases); ++i) {
        const Status expected = i >= 10 ? STATUS_OK : STATUS_INVALID_ARGUMENT;
        testing::internal::CaptureStdout();
        EXPECT_EQ(api.apply_transfer(cases[i].first.get(), record, cases[i].second.get()), expected) << i;
        EXPECT_EQ(apply_transfer(&api, cases[i].first.get(), &record, cases[i].second.get()), expected) << i;
        EXPECT_EQ(testing::internal::GetCapturedStdout(), "") << i;
    }
    EXPECT_EQ(cv::countNonZero(scratch != 5), 0);
}

}  // namespace
}  // namespace vora
