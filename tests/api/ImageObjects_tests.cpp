#include <gtest/gtest.h>

#include <cstdint>
#include <numeric>
#include <type_traits>
#include <vector>

#include <vora/vora.h>

namespace vora {
namespace {

// Hosts must release images through the library, never with delete or by copy.
static_assert(!std::is_destructible_v<IImage>, "an image is not deleted through its interface");
static_assert(!std::is_copy_constructible_v<CRGB8Image>, "image objects are not copied");
static_assert(!std::is_copy_constructible_v<CTileImage>, "image objects are not copied");

const size_t kLayout[4] = {11, 22, 33, 44};

std::vector<uint8_t> Pattern(size_t bytes) {
    std::vector<uint8_t> buffer(bytes);
    std::iota(buffer.begin(), buffer.end(), static_cast<uint8_t>(7));
    return buffer;
}

TEST(ImageObjects, WholeImageRowsArePacked) {
    std::vector<uint8_t> pixels = Pattern(36);
    IImage* image = CreateImageObj(3, 4, 3, kLayout, pixels.data(), CFullResImageSize(4, 3), CTopLeftCoordinate());
    ASSERT_NE(image, nullptr);
    EXPECT_EQ(image->GetWidth(), 4u);
    EXPECT_EQ(image->GetHeight(), 3u);
    EXPECT_EQ(image->GetChannels(), 3u);
    EXPECT_EQ(image->GetRowStride(), 12u);
    EXPECT_EQ(image->GetPixelStride(), 3u);
    EXPECT_EQ(image->GetData(), pixels.data());
    EXPECT_EQ(image->GetConstData(), pixels.data());
    EXPECT_EQ(image->GetFullResSize().width, 4u);
    EXPECT_EQ(image->GetFullResSize().height, 3u);
    EXPECT_EQ(image->GetTopLeft().left, 0u);
    EXPECT_EQ(image->GetTopLeft().top, 0u);
    DestroyImageObj(image);
}

TEST(ImageObjects, TileRowsAreAFullImageWidthApart) {
    std::vector<uint8_t> full(400 * 10 * 3);
    uint8_t* first = full.data() + (2 * 400 + 50) * 3;
    IImage* tile = GetTileImageObj(5, 100, 3, kLayout, first, CFullResImageSize(400, 10), CTopLeftCoordinate(50, 2));
    ASSERT_NE(tile, nullptr);
    EXPECT_EQ(tile->GetWidth(), 100u);
    EXPECT_EQ(tile->GetHeight(), 5u);
    EXPECT_EQ(tile->GetRowStride(), 1200u);
    EXPECT_EQ(tile->GetPixelStride(), 3u);
    EXPECT_EQ(tile->GetConstData(), first);
    EXPECT_EQ(tile->GetTopLeft().left, 50u);
    EXPECT_EQ(tile->GetTopLeft().top, 2u);
    EXPECT_EQ(tile->GetFullResSize().width, 400u);
    ReturnTileImageObj(tile);

    // A tile keeps its strides even without pixels.
    IImage* bare = GetTileImageObj(5, 100, 4, kLayout, nullptr, CFullResImageSize(400, 10), CTopLeftCoordinate());
    ASSERT_NE(bare, nullptr);
    EXPECT_EQ(bare->GetConstData(), nullptr);
    EXPECT_EQ(bare->GetRowStride(), 1600u);
    EXPECT_EQ(bare->GetPixelStride(), 4u);
    ReturnTileImageObj(bare);
}

TEST(ImageObjects, NullPixelsGiveGeometryOnly) {
    IImage* image = CreateImageObj(480, 640, 3, kLayout, nullptr, CFullResImageSize(640, 480), CTopLeftCoordinate());
    ASSERT_NE(image, nullptr);
    EXPECT_EQ(image->GetConstData(), nullptr);
    EXPECT_EQ(image->GetData(), nullptr);
    EXPECT_EQ(image->GetWidth(), 640u);
    EXPECT_EQ(image->GetHeight(), 480u);
    EXPECT_EQ(image->GetChannels(), 3u);
    DestroyImageObj(image);
}

TEST(ImageObjects, LayoutValuesRoundTrip) {
    std::vector<uint8_t> pixels = Pattern(12);
    for (IImage* image : {CreateImageObj(1, 4, 3, kLayout, pixels.data(), {4, 1}, {}),
                          GetTileImageObj(1, 4, 3, kLayout, pixels.data(), {4, 1}, {})}) {
        ASSERT_NE(image, nullptr);
        for (int i = 0; i < 4; ++i) EXPECT_EQ(image->GetLayoutValue(i), kLayout[i]);
        DestroyImageObj(image);
    }
}

TEST(ImageObjects, ReferenceCountStartsAtOne) {
    std::vector<uint8_t> pixels = Pattern(12);
    IImage* image = CreateImageObj(1, 4, 3, kLayout, pixels.data(), {4, 1}, {});
    ASSERT_NE(image, nullptr);
    EXPECT_EQ(image->AddRef(), 1u);  // the count before the increment
    EXPECT_EQ(image->AddRef(), 2u);
    EXPECT_EQ(image->Release(), 2u);  // two owners remain
    EXPECT_EQ(image->Release(), 1u);  // one owner remains; the object is alive
    EXPECT_EQ(image->GetWidth(), 4u);
    image->Release();  // the last owner: deletes (the result is not to be used)
}

TEST(ImageObjects, ReleasingNeverTouchesPixels) {
    const std::vector<uint8_t> expected = Pattern(400 * 4 * 3);
    std::vector<uint8_t> pixels = expected;
    const CFullResImageSize full(400, 4);

    // Every way of ending an object, on both classes, the two plain functions crossed.
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
