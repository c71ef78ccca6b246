#include <gtest/gtest.h>

#include <cstdint>
#include <numeric>
#include <sstream>
#include <string>
#include <tuple>
#include <type_traits>
#include <vector>

#include <vora/vora.h>

namespace vora {
namespace {

// Hosts must release images through the library, never with delete or by copy.
static_assert(!std::is_destructible_v<IImage>, "an image is not deleted through its interface");
static_assert(!std::is_copy_constructible_v<CRGB8Image> && !std::is_copy_constructible_v<CTileImage>,
              "image objects are not copied");

const size_t kLayout[4] = {11, 22, 33, 44};

std::string Geometry(const IImage& image) {
    std::ostringstream text;
    text << image.GetWidth() << "x" << image.GetHeight() << " of " << image.GetFullResSize().width << "x"
         << image.GetFullResSize().height << " at " << image.GetTopLeft().left << "," << image.GetTopLeft().top
         << ", strides " << image.GetRowStride() << "/" << image.GetPixelStride() << ", " << image.GetChannels()
         << " channels";
    return text.str();
}

// A whole image packs its rows; a tile's rows are a full image width apart,
// with or without pixels. Both keep the caller's pointer and layout values, and
// count references from one.
TEST(ImageObjects, GeometryStridesAndReferenceCounts) {
    std::vector<uint8_t> packed(36), full(400 * 10 * 3);
    uint8_t* first = full.data() + (2 * 400 + 50) * 3;
    const std::tuple<IImage*, const char*, uint8_t*> cases[] = {
        {CreateImageObj(3, 4, 3, kLayout, packed.data(), {4, 3}, {}), "4x3 of 4x3 at 0,0, strides 12/3, 3 channels",
         packed.data()},
        {GetTileImageObj(5, 100, 3, kLayout, first, {400, 10}, {50, 2}),
         "100x5 of 400x10 at 50,2, strides 1200/3, 3 channels", first},
        {GetTileImageObj(5, 100, 4, kLayout, nullptr, {400, 10}, {}),
         "100x5 of 400x10 at 0,0, strides 1600/4, 4 channels", nullptr}};
    for (const auto& [image, geometry, data] : cases) {
        ASSERT_NE(image, nullptr);
        EXPECT_EQ(Geometry(*image), geometry);
        EXPECT_EQ(image->GetData(), data);
        EXPECT_EQ(image->GetConstData(), data);
        for (int i = 0; i < 4; ++i) EXPECT_EQ(image->GetLayoutValue(i), kLayout[i]);
        EXPECT_EQ(image->AddRef(), 1u);   // the count before the increment
        EXPECT_EQ(image->AddRef(), 2u);
        EXPECT_EQ(image->Release(), 2u);  // two owners remain
        EXPECT_EQ(image->Release(), 1u);  // one owner remains; the object is alive
        EXPECT_GT(image->GetWidth(), 0u);
        image->Release();  // the last owner deletes
    }
    IImage* bare = CreateImageObj(480, 640, 3, kLayout, nullptr, {640, 480}, {});  // geometry only
    EXPECT_TRUE(bare->GetData() == nullptr && bare->GetWidth() == 640 && bare->GetHeight() == 480);
    DestroyImageObj(bare);
}

// Every way of ending an object, on both classes, the two plain functions crossed.
TEST(ImageObjects, ReleasingNeverTouchesPixels) {
    std::vector<uint8_t> expected(400 * 4 * 3), pixels;
    std::iota(expected.begin(), expected.end(), static_cast<uint8_t>(7));
    pixels = expected;
    const CFullResImageSize full(400, 4);
    DestroyImageObj(CreateImageObj(4, 400, 3, kLayout, pixels.data(), full, {}));
    ReturnTileImageObj(CreateImageObj(4, 400, 3, kLayout, pixels.data(), full, {}));
    DestroyImageObj(GetTileImageObj(2, 100, 3, kLayout, pixels.data() + 150, full, {50, 0}));
    ReturnTileImageObj(GetTileImageObj(2, 100, 3, kLayout, pixels.data() + 150, full, {50, 0}));
    CreateImageObj(4, 400, 3, kLayout, pixels.data(), full, {})->Destroy();
    GetTileImageObj(2, 100, 3, kLayout, pixels.data(), full, {})->Release();
    EXPECT_EQ(pixels, expected);
}

}  // namespace
}  // namespace vora
