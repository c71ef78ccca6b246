#include <gtest/gtest.h>

#include <cmath>
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

std::string Geometry(const IImage& image) {
    std::ostringstream text;
    text << image.GetWidth() << "x" << image.GetHeight() << " of " << image.GetFullResSize().width << "x"
         << image.GetFullResSize().height << " at " << image.GetTopLeft().left << "," << image.GetTopLeft().top
         << ", strides " << image.GetRowStride() << "/" << image.GetPixelStride() << ", " << image.GetChannels()
         << " channels";
    return text.str();
}

// A whole image packs its rows (a pixel-less one is geometry only); a tile's
// rows are a full image width apart, with or without pixels. All keep the
// caller's pointer and layout values and count references from one; every way
// of ending one, the two plain functions crossed, leaves the pixels alone.
TEST(ImageObjects, GeometryStridesReferenceCountsAndReleasing) {
    const size_t layout[4] = {11, 22, 33, 44};
    std::vector<uint8_t> packed(36), full(400 * 10 * 3);
    std::iota(packed.begin(), packed.end(), static_cast<uint8_t>(1));
    std::iota(full.begin(), full.end(), static_cast<uint8_t>(7));
    const std::vector<uint8_t> packedBefore = packed, fullBefore = full;
    uint8_t* first = full.data() + (2 * 400 + 50) * 3;
    const std::tuple<IImage*, const char*, uint8_t*, void (*)(IImage*)> cases[] = {
        {CreateImageObj(3, 4, 3, layout, packed.data(), {4, 3}, {}), "4x3 of 4x3 at 0,0, strides 12/3, 3 channels",
         packed.data(), ReturnTileImageObj},
        {CreateImageObj(480, 640, 3, layout, nullptr, {640, 480}, {}),
         "640x480 of 640x480 at 0,0, strides 0/0, 3 channels", nullptr, [](IImage* image) { image->Release(); }},
        {GetTileImageObj(5, 100, 3, layout, first, {400, 10}, {50, 2}),
         "100x5 of 400x10 at 50,2, strides 1200/3, 3 channels", first, DestroyImageObj},
        {GetTileImageObj(5, 100, 4, layout, nullptr, {400, 10}, {}),
         "100x5 of 400x10 at 0,0, strides 1600/4, 4 channels", nullptr, [](IImage* image) { image->Destroy(); }}};
    for (const auto& [image, geometry, data, end] : cases) {
        ASSERT_NE(image, nullptr);
        EXPECT_EQ(Geometry(*image), geometry);
        EXPECT_TRUE(image->GetData() == data && image->GetConstData() == data) << geometry;
        for (int i = 0; i < 4; ++i) EXPECT_EQ(image->GetLayoutValue(i), layout[i]);
        // AddRef gives the count before, Release the count after; one owner keeps the object alive.
        const uint32_t counts[] = {image->AddRef(), image->AddRef(), image->Release(), image->Release()};
        EXPECT_EQ(std::vector<uint32_t>(counts, counts + 4), (std::vector<uint32_t>{1, 2, 2, 1}));
        EXPECT_GT(image->GetWidth(), 0u);
        end(image);
    }
    EXPECT_TRUE(packed == packedBefore && full == fullBefore);
}

// Area counts pixels of an inclusive rectangle and does not look at
// emptiness; Empty is true only for strictly inverted sides (NaN never).
TEST(ImageObjects, DoubleRectAreaAndEmptinessAtTheirEdges) {
    const std::tuple<CDoubleRect, double, bool> cases[] = {  // rectangle, area, empty
        {CDoubleRect(), 1.0, false},                     // one pixel at the origin
        {CDoubleRect(2, 2, 3, 3), 1.0, false},           // a point
        {CDoubleRect(0, 9, 0, 4), 50.0, false},          // 10 x 5
        {CDoubleRect(3, 2, 0, 4), 0.0, true},            // inverted by one: no pixels
        {CDoubleRect(5, 2, 5, 2), 4.0, true},            // both inverted: positive product, still empty
        {CDoubleRect(0, 9, 4, 0), -30.0, true},          // one inverted: negative
        {CDoubleRect(0.5, 1.0, 0, 0), 1.5, false},       // fractional sides
    };
    for (const auto& [rect, area, empty] : cases) {
        SCOPED_TRACE(testing::Message() << rect.left << " " << rect.right << " " << rect.top << " " << rect.bottom);
        EXPECT_TRUE(rect.Area() == area && rect.Empty() == empty);
    }
    const CDoubleRect nan(std::nan(""), 1, 0, 1);
    EXPECT_FALSE(nan.Empty());
    EXPECT_TRUE(std::isnan(nan.Area()));
}

}  // namespace
}  // namespace vora
