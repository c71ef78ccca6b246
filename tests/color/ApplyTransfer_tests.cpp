#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <functional>
#include <memory>
#include <numeric>
#include <random>
#include <string>
#include <vector>

#include "color/ApplyTransfer.h"
#include "color/ColorConversion.h"

namespace vora {
namespace {

struct Picture {
    size_t width, height, channels;
    std::vector<uint8_t> bytes;
};

// Gradients and noise; bytes from 3 on are noise for apply to leave alone.
Picture Photo(size_t width, size_t height, size_t channels = 3) {
    Picture p{width, height, channels, std::vector<uint8_t>(width * height * channels)};
    std::mt19937 random(1);
    for (size_t i = 0; i < p.bytes.size(); ++i) {
        const size_t pixel = i / channels, c = i % channels;
        const double u = static_cast<double>(pixel % width) / width, v = static_cast<double>(pixel / width) / height;
        const double rgb[3] = {40 + 170 * u, 60 + 120 * v, 200 - 150 * u * v};
        p.bytes[i] = static_cast<uint8_t>(c < 3 ? rgb[c] + random() % 7 : random() % 256);
    }
    return p;
}

struct ImageDeleter {
    void operator()(IImage* image) const { DestroyImageObj(image); }
};
using ImagePtr = std::unique_ptr<IImage, ImageDeleter>;
const size_t kLayout[4] = {};

ImagePtr Tile(Picture& p, size_t left, size_t top, size_t width, size_t height) {
    uint8_t* first = p.bytes.data() + (top * p.width + left) * p.channels;
    return ImagePtr(GetTileImageObj(height, width, p.channels, kLayout, first, {p.width, p.height}, {left, top}));
}
ImagePtr Whole(Picture& p) {
    return ImagePtr(CreateImageObj(p.height, p.width, p.channels, kLayout, p.bytes.data(), {p.width, p.height}, {}));
}

// The styled record differs from the identity in every term and has two overlapping faces.
TRANSFER Record(bool styled, bool faces = true) {
    const float styledTerms[8] = {4.5f, -7.25f, -3.0f, 12.5f, 0.9f, 0.35f, -0.2f, 1.15f};
    const float identityTerms[8] = {0, 0, 0, 0, 1, 0, 0, 1};
    const float* terms = styled ? styledTerms : identityTerms;  // means, then the chroma matrix
    TRANSFER t;
    std::copy_n(terms, 2, t.contentMean);
    std::copy_n(terms + 2, 2, t.styleMean);
    std::copy_n(terms + 4, 4, t.chromaMatrix);
    for (int i = 0; i < 257; ++i) {
        const float x = std::min(i / 255.0f, 1.0f);
        t.toneCurve[i] = styled ? x * x * (3.0f - 2.0f * x) : x;
    }
    t.lightnessLow = styled ? 0.08f : 0.0f;
    t.lightnessHigh = styled ? 0.93f : 1.0f;
    if (styled && faces) {
        t.faceCorrections = {{0.45f, 0.37f, 0.05f, 0.07f, 0.35f, 18, 20, 0.6f},
                             {0.52f, 0.41f, 0.04f, 0.05f, 0.4f, 10, 15, 0.75f}};
    }
    return t;
}

std::vector<uint8_t> ApplyWhole(Picture source, const TRANSFER& transfer, bool serial = false,
                                std::string* printed = nullptr) {
    Picture out{source.width, source.height, source.channels, std::vector<uint8_t>(source.bytes.size(), 7)};
    testing::internal::CaptureStdout();
    const auto apply = serial ? ApplyTransferSerial : ApplyTransfer;
    EXPECT_EQ(apply(Whole(source).get(), transfer, Whole(out).get()), STATUS_OK);
    const std::string text = testing::internal::GetCapturedStdout();
    if (printed) *printed = text;
    return out.bytes;
}

// Refused geometry writes and prints nothing; an empty source is no error and writes nothing either.
TEST(ApplyTransfer, RefusesGeometryThatWouldEscapeTheBuffers) {
    Picture source = Photo(12, 8);
    std::vector<uint8_t> scratch(20 * 8 * 4, 5);  // every destination points here
    auto over = [](uint8_t* data, size_t width, size_t height, size_t channels, size_t rowPixels, size_t top = 0) {
        return ImagePtr(GetTileImageObj(height, width, channels, kLayout, data, {rowPixels, height + top}, {0, top}));
    };
    uint8_t* const s = scratch.data();
    // Overlapping: rows closer than a row of pixels, as in a tile wider than its image.
    enum { kGood, kOut, kNoPixels, kGrey, kOverlapping, kOverlappingOut, kNarrower, kShorter, kWiderRows,
           kWiderPixels, kNoRows, kNoColumns, kNull };
    const ImagePtr images[] = {Whole(source),         over(s, 12, 8, 3, 12), over(nullptr, 12, 8, 3, 12),
                               over(s, 12, 8, 1, 12), over(source.bytes.data(), 12, 8, 3, 10),
                               over(s, 12, 8, 3, 10), over(s, 11, 8, 3, 11), over(s, 12, 7, 3, 12),
                               over(s, 12, 8, 3, 20), over(s, 12, 8, 4, 12), over(source.bytes.data(), 12, 0, 3, 12, 2),
                               over(source.bytes.data(), 0, 8, 3, 12, 1), ImagePtr()};
    const int cases[][2] = {{kNull, kOut},   {kGood, kNull},     {kNoPixels, kOut},    {kGood, kNoPixels},
                            {kGrey, kGrey},  {kOverlapping, kOverlappingOut},          {kGood, kNarrower},
                            {kGood, kShorter}, {kGood, kWiderRows}, {kGood, kWiderPixels}, {kNoRows, kOut},
                            {kNoColumns, kOut}};
    for (const auto& c : cases) {
        IImage* in = images[c[0]].get();
        IImage* out = images[c[1]].get();
        const Status expected = c[0] == kNoRows || c[0] == kNoColumns ? STATUS_OK : STATUS_INVALID_ARGUMENT;
        testing::internal::CaptureStdout();
        EXPECT_EQ(ApplyTransfer(in, Record(true), out), expected) << c[0] << "," << c[1];
        EXPECT_EQ(ApplyTransferSerial(in, Record(true), out), expected) << c[0] << "," << c[1];
        EXPECT_EQ(testing::internal::GetCapturedStdout(), "") << c[0] << "," << c[1];
    }
    EXPECT_EQ(std::count(scratch.begin(), scratch.end(), 5), static_cast<long>(scratch.size()));
}

// Pixel by pixel: the identity record keeps a grey's round trip through the
// tables; a zero lightness spread gives toneCurve[255] (the guard entry 256 is
// read with weight 0). Bytes 0..2 are R, G, B; the destination's byte 3 stays.
TEST(ApplyTransfer, KnownAnswers) {
    TRANSFER identity = Record(false), flat = identity;
    flat.lightnessLow = flat.lightnessHigh = 0.4f;
    flat.toneCurve[255] = 0.3f;
    flat.toneCurve[256] = 0.9f;
    Picture source = Photo(256, 8, 4);
    for (size_t v = 0; v < 256; ++v) std::fill_n(&source.bytes[v * 4], 3, static_cast<uint8_t>(v));  // row 0: greys
    for (const TRANSFER* t : {&identity, &flat}) {
        const std::vector<uint8_t> result = ApplyWhole(source, *t);
        for (size_t i = 0; i < (t == &identity ? 256u : 256u * 8); ++i) {
            const LabPixel lab = RgbToLab(source.bytes[i * 4], source.bytes[i * 4 + 1], source.bytes[i * 4 + 2]);
            const Rgb8 e = LabToRgb(t == &identity ? lab.lightness01 : 0.3f, lab.a, lab.b);
            const uint8_t expected[4] = {e.red, e.green, e.blue, 7};
            ASSERT_TRUE(std::equal(expected, expected + 4, &result[i * 4])) << "pixel " << i;
        }
    }
}

// A face whose box is exactly [3/16, 13/16] both ways: rows and columns 3 and 13 lie on its edge.
TEST(ApplyTransfer, FaceBoxEdgeIsOutside) {
    Picture grey{16, 16, 3, std::vector<uint8_t>(16 * 16 * 3, 70)};
    TRANSFER lifted = Record(false);
    lifted.faceCorrections.push_back(FaceCorrection{0.5f, 0.5f, 0.125f, 0.125f, 0.3f, 0.0f, 0.0f, 0.5f});
    const std::vector<uint8_t> without = ApplyWhole(grey, Record(false)), with = ApplyWhole(grey, lifted);
    for (size_t i = 0; i < with.size(); i += 3) {
        const size_t x = i / 3 % 16, y = i / 48;
        const bool inside = x > 3 && x < 13 && y > 3 && y < 13;
        EXPECT_TRUE(inside ? with[i] >= without[i] : with[i] == without[i]) << x << "," << y;
    }
    EXPECT_GT(with[(8 * 16 + 4) * 3], without[(8 * 16 + 4) * 3]);  // next to the edge the lift shows
    EXPECT_GT(with[(8 * 16 + 8) * 3], without[(8 * 16 + 8) * 3] + 20);
}

const Picture& BigPhoto() {
    static const Picture photo = Photo(1500, 1000);
    return photo;
}
const std::vector<uint8_t>& Reference() {  // serial, whole image, out of place
    static const std::vector<uint8_t> bytes = ApplyWhole(BigPhoto(), Record(true), true);
    return bytes;
}
size_t DifferentBytes(const std::vector<uint8_t>& a, const std::vector<uint8_t>& b) {
    return std::inner_product(a.begin(), a.end(), b.begin(), size_t{0}, std::plus<>(), std::not_equal_to<>());
}

TEST(ApplyTransfer, ParallelInPlaceAndCopiedRecordsMatchSerial) {
    // Guards against comparing unchanged images: the transfer and the faces both show.
    std::string printed;
    EXPECT_GT(DifferentBytes(Reference(), BigPhoto().bytes), Reference().size() / 2);
    EXPECT_GT(DifferentBytes(Reference(), ApplyWhole(BigPhoto(), Record(true, false), false, &printed)), 10000u);
    EXPECT_EQ(printed, "");  // no faces, no line
    EXPECT_TRUE(ApplyWhole(BigPhoto(), Record(true)) == Reference());
    Picture picture = BigPhoto();
    testing::internal::CaptureStdout();
    ASSERT_EQ(ApplyTransfer(Whole(picture).get(), Record(true), Whole(picture).get()), STATUS_OK);
    testing::internal::GetCapturedStdout();
    EXPECT_TRUE(picture.bytes == Reference());

    const auto copy = std::make_unique<TRANSFER>(*std::make_unique<TRANSFER>(Record(true)));  // original gone
    EXPECT_TRUE(ApplyWhole(BigPhoto(), *copy) == Reference());
    TRANSFER assigned;
    assigned = *copy;
    std::swap(assigned.faceCorrections[0], assigned.faceCorrections[1]);  // faces combine by maximum
    EXPECT_TRUE(ApplyWhole(BigPhoto(), assigned) == Reference());
}

// Random tilings applied tile by tile in random order, out of place and in place;
// only the tile at the origin prints the faces line.
TEST(ApplyTransfer, TilesMatchWholeImage) {
    std::mt19937 random(20240611);
    for (int tiling = 0; tiling < 4; ++tiling) {
        std::vector<size_t> xs = {0, 675, 799, 1500}, ys = {0, 349, 410, 1000};  // through both face boxes
        for (int i = tiling + 2; i > 0; --i) {
            xs.push_back(1 + random() % 1499);
            ys.push_back(1 + random() % 999);
        }
        for (std::vector<size_t>* cuts : {&xs, &ys}) {
            std::sort(cuts->begin(), cuts->end());
            cuts->erase(std::unique(cuts->begin(), cuts->end()), cuts->end());
        }
        std::vector<std::array<size_t, 4>> tiles;
        for (size_t j = 0; j + 1 < ys.size(); ++j) {
            for (size_t i = 0; i + 1 < xs.size(); ++i) {
                tiles.push_back({xs[i], ys[j], xs[i + 1] - xs[i], ys[j + 1] - ys[j]});
            }
        }
        std::shuffle(tiles.begin(), tiles.end(), random);
        Picture source = BigPhoto(), separate{1500, 1000, 3, std::vector<uint8_t>(source.bytes.size(), 0)};
        Picture& destination = tiling % 2 ? source : separate;
        testing::internal::CaptureStdout();
        for (const auto& r : tiles) {
            const ImagePtr in = Tile(source, r[0], r[1], r[2], r[3]), out = Tile(destination, r[0], r[1], r[2], r[3]);
            EXPECT_EQ(ApplyTransfer(in.get(), Record(true), out.get()), STATUS_OK);
        }
        EXPECT_EQ(testing::internal::GetCapturedStdout(), "Correct 2 faces!!\n");
        EXPECT_EQ(DifferentBytes(destination.bytes, Reference()), 0u) << "tiling " << tiling;
    }
}

}  // namespace
}  // namespace vora
