#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "color/ApplyTransfer.h"
#include "color/ColorConversion.h"
#include "color/PixelTransfer.h"

namespace vora {
namespace {

// ---------------------------------------------------------------------------
// Fixtures made by code: pictures, image objects over them, records.
// ---------------------------------------------------------------------------

struct Picture {
    size_t width;
    size_t height;
    size_t channels;
    std::vector<uint8_t> bytes;

    uint8_t* At(size_t left, size_t top) { return bytes.data() + (top * width + left) * channels; }
};

// A smooth synthetic photograph: broad gradients and slow waves in every
// channel, a warm oval in the upper middle, a little noise; extra channels
// hold a pattern that apply must leave alone.
Picture SmoothPhoto(size_t width, size_t height, size_t channels = 3, unsigned seed = 1) {
    Picture picture{width, height, channels, std::vector<uint8_t>(width * height * channels)};
    std::mt19937 random(seed);
    std::uniform_int_distribution<int> noise(-3, 3);
    for (size_t y = 0; y < height; ++y) {
        for (size_t x = 0; x < width; ++x) {
            const double u = static_cast<double>(x) / static_cast<double>(width);
            const double v = static_cast<double>(y) / static_cast<double>(height);
            double r = 40 + 170 * u + 30 * std::sin(9 * v + 2 * u);
            double g = 60 + 120 * v + 40 * std::sin(7 * u - 3 * v);
            double b = 200 - 150 * u * v + 25 * std::cos(11 * u * v);
            const double ox = (u - 0.45) / 0.12, oy = (v - 0.35) / 0.18;
            if (ox * ox + oy * oy < 1.0) {  // skin-like
                r = 0.3 * r + 0.7 * 200;
                g = 0.3 * g + 0.7 * 150;
                b = 0.3 * b + 0.7 * 120;
            }
            uint8_t* pixel = picture.At(x, y);
            const double rgb[3] = {r, g, b};
            for (int c = 0; c < 3; ++c) pixel[c] = static_cast<uint8_t>(std::clamp(rgb[c] + noise(random), 0.0, 255.0));
            for (size_t c = 3; c < channels; ++c) pixel[c] = static_cast<uint8_t>(x * 7 + y * 13 + c);
        }
    }
    return picture;
}

Picture RandomPicture(size_t width, size_t height, size_t channels, unsigned seed) {
    Picture picture{width, height, channels, std::vector<uint8_t>(width * height * channels)};
    std::mt19937 random(seed);
    std::uniform_int_distribution<int> byte(0, 255);
    for (uint8_t& value : picture.bytes) value = static_cast<uint8_t>(byte(random));
    return picture;
}

struct ImageDeleter {
    void operator()(IImage* image) const { DestroyImageObj(image); }
};
using ImagePtr = std::unique_ptr<IImage, ImageDeleter>;

const size_t kLayout[4] = {0, 0, 0, 0};

ImagePtr Whole(Picture& picture) {
    return ImagePtr(CreateImageObj(picture.height, picture.width, picture.channels, kLayout, picture.bytes.data(),
                                   CFullResImageSize(picture.width, picture.height), CTopLeftCoordinate()));
}

ImagePtr Tile(Picture& picture, size_t left, size_t top, size_t width, size_t height) {
    return ImagePtr(GetTileImageObj(height, width, picture.channels, kLayout, picture.At(left, top),
                                    CFullResImageSize(picture.width, picture.height), CTopLeftCoordinate(left, top)));
}

TRANSFER IdentityRecord() {
    TRANSFER transfer;
    for (int i = 0; i < 256; ++i) transfer.toneCurve[i] = static_cast<float>(i) / 255.0f;
    transfer.toneCurve[256] = 1.0f;
    transfer.lightnessLow = 0.0f;
    transfer.lightnessHigh = 1.0f;
    transfer.chromaMatrix[0] = 1.0f;
    transfer.chromaMatrix[3] = 1.0f;
    return transfer;
}

// A record unlike the identity in every term: an S-shaped curve, a narrowed
// lightness range, different means and a matrix that is not symmetric.
TRANSFER StyledRecord() {
    TRANSFER transfer;
    for (int i = 0; i < 256; ++i) {
        const float x = static_cast<float>(i) / 255.0f;
        transfer.toneCurve[i] = x * x * (3.0f - 2.0f * x);
    }
    transfer.toneCurve[256] = 1.0f;
    transfer.lightnessLow = 0.08f;
    transfer.lightnessHigh = 0.93f;
    transfer.contentMean[0] = 4.5f;
    transfer.contentMean[1] = -7.25f;
    transfer.styleMean[0] = -3.0f;
    transfer.styleMean[1] = 12.5f;
    transfer.chromaMatrix[0] = 0.9f;
    transfer.chromaMatrix[1] = 0.35f;
    transfer.chromaMatrix[2] = -0.2f;
    transfer.chromaMatrix[3] = 1.15f;
    return transfer;
}

// Two faces of the smooth photo that overlap and brighten.
void AddFaces(TRANSFER& transfer) {
    transfer.faceCorrections.push_back(FaceCorrection{0.45f, 0.37f, 0.05f, 0.07f, 0.35f, 18.0f, 20.0f, 0.6f});
    transfer.faceCorrections.push_back(FaceCorrection{0.52f, 0.41f, 0.04f, 0.05f, 0.40f, 10.0f, 15.0f, 0.75f});
}

std::vector<uint8_t> ApplyWhole(const Picture& source, const TRANSFER& transfer, bool serial = false) {
    Picture in = source;
    Picture out{source.width, source.height, source.channels, std::vector<uint8_t>(source.bytes.size(), 0)};
    ImagePtr inImage = Whole(in);
    ImagePtr outImage = Whole(out);
    testing::internal::CaptureStdout();  // the faces line, tested on its own
    const Status status = serial ? ApplyTransferSerial(inImage.get(), transfer, outImage.get())
                                 : ApplyTransfer(inImage.get(), transfer, outImage.get());
    testing::internal::GetCapturedStdout();
    EXPECT_EQ(status, STATUS_OK);
    return out.bytes;
}

size_t CountDifferentBytes(const std::vector<uint8_t>& a, const std::vector<uint8_t>& b) {
    size_t count = 0;
    for (size_t i = 0; i < a.size(); ++i) count += a[i] != b[i] ? 1 : 0;
    return count;
}

// ---------------------------------------------------------------------------
// Arguments
// ---------------------------------------------------------------------------

TEST(ApplyTransfer, EmptySourceChangesNothing) {
    TRANSFER transfer = StyledRecord();
    Picture picture = SmoothPhoto(8, 6);
    const std::vector<uint8_t> before = picture.bytes;
    const CFullResImageSize full(8, 6);
    const ImagePtr destination = Whole(picture);
    const ImagePtr noRows(CreateImageObj(0, 8, 3, kLayout, picture.bytes.data(), full, CTopLeftCoordinate(0, 2)));
    const ImagePtr noColumns(GetTileImageObj(6, 0, 3, kLayout, picture.At(3, 0), full, CTopLeftCoordinate(3, 0)));
    const ImagePtr noPixels(CreateImageObj(0, 0, 3, kLayout, nullptr, full, CTopLeftCoordinate(1, 1)));
    for (IImage* source : {noRows.get(), noColumns.get(), noPixels.get()}) {
        EXPECT_EQ(ApplyTransfer(source, transfer, destination.get()), STATUS_OK);
        EXPECT_EQ(ApplyTransferSerial(source, transfer, destination.get()), STATUS_OK);
    }
    EXPECT_EQ(picture.bytes, before);
}

TEST(ApplyTransfer, RejectsGeometryThatWouldEscapeTheBuffers) {
    TRANSFER transfer = StyledRecord();
    AddFaces(transfer);
    Picture source = SmoothPhoto(12, 8);
    Picture destination = SmoothPhoto(12, 8, 3, 2);
    Picture wide = SmoothPhoto(20, 8, 3, 3);
    Picture fourChannels = SmoothPhoto(12, 8, 4, 4);
    Picture grey{12, 8, 1, std::vector<uint8_t>(96, 128)};
    const std::vector<uint8_t> destinationBefore = destination.bytes;
    const std::vector<uint8_t> wideBefore = wide.bytes;
    const std::vector<uint8_t> fourBefore = fourChannels.bytes;
    const std::vector<uint8_t> greyBefore = grey.bytes;
    const CFullResImageSize full(12, 8);

    const ImagePtr good = Whole(source);
    const ImagePtr goodDestination = Whole(destination);
    const ImagePtr pixelless(CreateImageObj(8, 12, 3, kLayout, nullptr, full, CTopLeftCoordinate()));
    const ImagePtr narrower(CreateImageObj(8, 11, 3, kLayout, destination.bytes.data(), {11, 8}, {}));
    const ImagePtr shorter(CreateImageObj(7, 12, 3, kLayout, destination.bytes.data(), {12, 7}, {}));
    const ImagePtr widerRows = Tile(wide, 0, 0, 12, 8);  // same size, rows 20 pixels apart
    const ImagePtr widerPixels = Whole(fourChannels);
    const ImagePtr greyImage = Whole(grey);
    // A tile wider than the image it claims to be part of: its rows overlap.
    const ImagePtr overlapping(GetTileImageObj(8, 12, 3, kLayout, source.bytes.data(), {10, 8}, {}));
    const ImagePtr overlappingDestination(GetTileImageObj(8, 12, 3, kLayout, destination.bytes.data(), {10, 8}, {}));

    struct Case {
        const char* name;
        const IImage* source;
        IImage* destination;
    };
    const Case cases[] = {
        {"null source", nullptr, goodDestination.get()},
        {"null destination", good.get(), nullptr},
        {"source without pixels", pixelless.get(), goodDestination.get()},
        {"destination without pixels", good.get(), pixelless.get()},
        {"narrower destination", good.get(), narrower.get()},
        {"shorter destination", good.get(), shorter.get()},
        {"different row stride", good.get(), widerRows.get()},
        {"different pixel stride", good.get(), widerPixels.get()},
        {"pixel stride below three", greyImage.get(), greyImage.get()},
        {"overlapping rows", overlapping.get(), overlappingDestination.get()},
    };
    for (const Case& c : cases) {
        testing::internal::CaptureStdout();
        EXPECT_EQ(ApplyTransfer(c.source, transfer, c.destination), STATUS_INVALID_ARGUMENT) << c.name;
        EXPECT_EQ(ApplyTransferSerial(c.source, transfer, c.destination), STATUS_INVALID_ARGUMENT) << c.name;
        EXPECT_EQ(testing::internal::GetCapturedStdout(), "") << c.name;
    }
    EXPECT_EQ(destination.bytes, destinationBefore);
    EXPECT_EQ(wide.bytes, wideBefore);
    EXPECT_EQ(fourChannels.bytes, fourBefore);
    EXPECT_EQ(grey.bytes, greyBefore);
}

// ---------------------------------------------------------------------------
// The per-pixel transfer
// ---------------------------------------------------------------------------

// The transfer of one pixel written out term by term: conversions, tone
// curve, chroma map, and the face lift at position (px, py).
Rgb8 ExpectedPixel(const TRANSFER& transfer, const uint8_t* rgb, float px, float py) {
    const LabPixel lab = RgbToLab(rgb[0], rgb[1], rgb[2]);
    const float t = NormaliseLightness(lab.lightness01, transfer.lightnessLow, transfer.lightnessHigh);
    const float base = ToneCurveLookup(transfer.toneCurve, t);
    const float d0 = lab.a - transfer.contentMean[0];
    const float d1 = lab.b - transfer.contentMean[1];
    const float a = transfer.chromaMatrix[0] * d0 + transfer.chromaMatrix[1] * d1 + transfer.styleMean[0];
    const float b = transfer.chromaMatrix[2] * d0 + transfer.chromaMatrix[3] * d1 + transfer.styleMean[1];
    float lightness = base;
    for (const FaceCorrection& f : transfer.faceCorrections) {
        const float reach[2] = {f.halfSizeX * 2.5f, f.halfSizeY * 2.5f};
        if (px > f.centreX - reach[0] && px < f.centreX + reach[0] && py > f.centreY - reach[1] &&
            py < f.centreY + reach[1]) {
            const float dx = (px - f.centreX) / f.halfSizeX;
            const float dy = (py - f.centreY) / f.halfSizeY;
            const float chromaDistance = (f.measuredA - a) * (f.measuredA - a) + (f.measuredB - b) * (f.measuredB - b);
            const float w = expf(chromaDistance / -1000.0f - (dx * dx + dy * dy) / 2.2f);
            lightness = std::max(powf(base, f.exponent) * w + (1.0f - w) * base, lightness);
        }
    }
    return LabToRgb(lightness, a, b);
}

// Each pixel of a tile independently, with and without faces: bytes 0..2 read
// as R, G, B, positions in full-image coordinates, bytes from 3 on untouched.
TEST(ApplyTransfer, EachPixelFollowsTheTransferOfOnePixel) {
    TRANSFER withFaces = StyledRecord();
    withFaces.faceCorrections.push_back(FaceCorrection{0.40f, 0.50f, 0.09f, 0.15f, 0.3f, 6.0f, -4.0f, 0.55f});
    withFaces.faceCorrections.push_back(FaceCorrection{0.55f, 0.35f, 0.05f, 0.03f, 0.3f, -20.0f, 25.0f, 0.8f});
    const size_t left = 17, top = 9, width = 45, height = 31;
    for (const TRANSFER& transfer : {StyledRecord(), withFaces}) {
        Picture source = RandomPicture(80, 50, 4, 5);
        Picture destination{80, 50, 4, std::vector<uint8_t>(80 * 50 * 4, 0)};
        const ImagePtr in = Tile(source, left, top, width, height);
        const ImagePtr out = Tile(destination, left, top, width, height);
        ASSERT_EQ(ApplyTransferSerial(in.get(), transfer, out.get()), STATUS_OK);
        TRANSFER plain = transfer;
        plain.faceCorrections.clear();
        size_t lifted = 0;
        for (size_t y = 0; y < 50; ++y) {
            for (size_t x = 0; x < 80; ++x) {
                const uint8_t* result = destination.At(x, y);
                const bool inTile = x >= left && x < left + width && y >= top && y < top + height;
                if (!inTile) {
                    ASSERT_EQ(result[0] | result[1] | result[2] | result[3], 0) << x << "," << y;
                    continue;
                }
                const float px = static_cast<float>(x) / 80.0f, py = static_cast<float>(y) / 50.0f;
                const Rgb8 expected = ExpectedPixel(transfer, source.At(x, y), px, py);
                ASSERT_EQ(result[0], expected.red) << x << "," << y;
                ASSERT_EQ(result[1], expected.green) << x << "," << y;
                ASSERT_EQ(result[2], expected.blue) << x << "," << y;
                ASSERT_EQ(result[3], 0) << x << "," << y;  // the destination's own fourth byte stays
                const Rgb8 unlifted = ExpectedPixel(plain, source.At(x, y), px, py);
                lifted += expected.red != unlifted.red || expected.green != unlifted.green ? 1 : 0;
            }
        }
        if (!transfer.faceCorrections.empty()) {
            EXPECT_GT(lifted, 100u);  // the faces do show
        }
    }
}

TEST(ApplyTransfer, ZeroLightnessSpreadUsesTheLastCurveEntry) {
    TRANSFER transfer = IdentityRecord();
    transfer.lightnessLow = transfer.lightnessHigh = 0.4f;
    transfer.toneCurve[255] = 0.3f;
    transfer.toneCurve[256] = 0.9f;  // the guard entry is read with weight 0
    const Picture source = RandomPicture(64, 16, 3, 6);
    const std::vector<uint8_t> result = ApplyWhole(source, transfer);
    for (size_t i = 0; i < source.width * source.height; ++i) {
        const uint8_t* in = &source.bytes[i * 3];
        const LabPixel lab = RgbToLab(in[0], in[1], in[2]);
        const Rgb8 expected = LabToRgb(0.3f, lab.a, lab.b);
        ASSERT_EQ(result[i * 3 + 0], expected.red) << "pixel " << i;
        ASSERT_EQ(result[i * 3 + 1], expected.green) << "pixel " << i;
        ASSERT_EQ(result[i * 3 + 2], expected.blue) << "pixel " << i;
    }
}

// The identity record loses only what the round trip through the tables loses:
// greys exactly that; colours at most one more level, from the float
// interpolation of the curve (colours near black are left out, where one unit
// of lightness can cross a coarse table step).
TEST(ApplyTransfer, IdentityRecordLosesOnlyTheRoundTrip) {
    const TRANSFER transfer = IdentityRecord();
    Picture greys{256, 1, 3, std::vector<uint8_t>(256 * 3)};
    for (size_t v = 0; v < 256; ++v) std::fill_n(greys.At(v, 0), 3, static_cast<uint8_t>(v));
    Picture colours = RandomPicture(256, 64, 3, 7);
    for (uint8_t& value : colours.bytes) value = static_cast<uint8_t>(16 + value % 240);

    for (const Picture* picture : {&greys, &colours}) {
        const std::vector<uint8_t> result = ApplyWhole(*picture, transfer);
        const int tolerance = picture == &greys ? 0 : 1;
        size_t changed = 0;
        for (size_t i = 0; i < picture->width * picture->height; ++i) {
            const uint8_t* in = &picture->bytes[i * 3];
            const LabPixel lab = RgbToLab(in[0], in[1], in[2]);
            const Rgb8 roundTrip = LabToRgb(lab.lightness01, lab.a, lab.b);
            const uint8_t expected[3] = {roundTrip.red, roundTrip.green, roundTrip.blue};
            for (int c = 0; c < 3; ++c) {
                ASSERT_LE(std::abs(result[i * 3 + c] - expected[c]), tolerance) << "pixel " << i;
                changed += result[i * 3 + c] != in[c] ? 1 : 0;
            }
        }
        EXPECT_GT(changed, 0u);  // the round trip does lose something
    }
}

// ---------------------------------------------------------------------------
// Faces
// ---------------------------------------------------------------------------

TEST(ApplyTransfer, FaceBoxesAreComputedInFloat) {
    TRANSFER transfer;
    transfer.faceCorrections.push_back(FaceCorrection{0.3f, 0.7f, 0.1f, 0.13f, 0, 0, 0, 1});
    const std::vector<FaceBox> boxes = MakeFaceBoxes(transfer);
    ASSERT_EQ(boxes.size(), 1u);
    EXPECT_EQ(boxes[0].xLow, static_cast<double>(0.3f - 0.1f * 2.5f));
    EXPECT_EQ(boxes[0].xHigh, static_cast<double>(0.3f + 0.1f * 2.5f));
    EXPECT_EQ(boxes[0].yLow, static_cast<double>(0.7f - 0.13f * 2.5f));
    EXPECT_EQ(boxes[0].yHigh, static_cast<double>(0.7f + 0.13f * 2.5f));
    // The same bound computed in double would differ: the test can tell them apart.
    EXPECT_NE(boxes[0].xLow, static_cast<double>(0.3f) - static_cast<double>(0.1f) * 2.5);
}

// A 16 x 16 grey image and a face whose box is [3/16, 13/16] in both
// directions, exactly: pixels on columns or rows 3 and 13 are on its edge.
TEST(ApplyTransfer, PixelsOnAFaceBoxEdgeAreOutside) {
    Picture grey{16, 16, 3, std::vector<uint8_t>(16 * 16 * 3, 70)};
    const TRANSFER plain = IdentityRecord();
    TRANSFER lifted = plain;
    lifted.faceCorrections.push_back(FaceCorrection{0.5f, 0.5f, 0.125f, 0.125f, 0.3f, 0.0f, 0.0f, 0.5f});

    const std::vector<uint8_t> without = ApplyWhole(grey, plain);
    const std::vector<uint8_t> with = ApplyWhole(grey, lifted);
    for (size_t y = 0; y < 16; ++y) {
        for (size_t x = 0; x < 16; ++x) {
            const size_t i = (y * 16 + x) * 3;
            const bool inside = x > 3 && x < 13 && y > 3 && y < 13;
            if (!inside) {
                EXPECT_EQ(with[i], without[i]) << x << "," << y;
            } else {
                EXPECT_GE(with[i], without[i]) << x << "," << y;
            }
        }
    }
    // Next to the edge the lift is still visible, so an inclusive test would show.
    const size_t nextToEdge = (8 * 16 + 4) * 3;
    EXPECT_GT(with[nextToEdge], without[nextToEdge]);
    EXPECT_GT(with[(8 * 16 + 8) * 3], without[(8 * 16 + 8) * 3] + 20);
}

// Every face starts from the curve's lightness and faces combine by maximum:
// a repeated face adds nothing, order does not matter, and a face that would
// darken (exponent above 1) changes nothing.
TEST(ApplyTransfer, FacesCombineByMaximumFromOneBase) {
    const Picture photo = SmoothPhoto(300, 200);
    TRANSFER one = StyledRecord();
    TRANSFER both = one;
    AddFaces(both);
    one.faceCorrections.push_back(both.faceCorrections[0]);
    TRANSFER repeated = one;
    repeated.faceCorrections.push_back(both.faceCorrections[0]);
    TRANSFER swapped = both;
    std::swap(swapped.faceCorrections[0], swapped.faceCorrections[1]);
    TRANSFER darkening = StyledRecord();
    darkening.faceCorrections.push_back(FaceCorrection{0.45f, 0.37f, 0.05f, 0.07f, 0.8f, 18.0f, 20.0f, 2.0f});

    const std::vector<uint8_t> withOne = ApplyWhole(photo, one);
    const std::vector<uint8_t> withBoth = ApplyWhole(photo, both);
    EXPECT_GT(CountDifferentBytes(withOne, withBoth), 0u);  // the second face matters
    EXPECT_EQ(ApplyWhole(photo, repeated), withOne);
    EXPECT_EQ(ApplyWhole(photo, swapped), withBoth);
    EXPECT_EQ(ApplyWhole(photo, darkening), ApplyWhole(photo, StyledRecord()));
}

TEST(ApplyTransfer, FacesLineIsPrintedOnceByTheOriginTile) {
    Picture photo = SmoothPhoto(40, 30);
    Picture output = photo;
    TRANSFER withFaces = StyledRecord();
    AddFaces(withFaces);
    const TRANSFER withoutFaces = StyledRecord();

    testing::internal::CaptureStdout();
    for (size_t top : {0, 10, 20}) {
        for (size_t left : {0, 20}) {
            const ImagePtr in = Tile(photo, left, top, 20, 10);
            const ImagePtr out = Tile(output, left, top, 20, 10);
            EXPECT_EQ(ApplyTransfer(in.get(), withFaces, out.get()), STATUS_OK);
            EXPECT_EQ(ApplyTransfer(in.get(), withoutFaces, out.get()), STATUS_OK);
        }
    }
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "Correct 2 faces!!\n");

    const ImagePtr whole = Whole(photo);
    const ImagePtr wholeOut = Whole(output);
    testing::internal::CaptureStdout();
    ApplyTransferSerial(whole.get(), withoutFaces, wholeOut.get());
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "");
}

// ---------------------------------------------------------------------------
// The same bytes however the work is split
// ---------------------------------------------------------------------------

class ApplyTransferPhoto : public testing::Test {
protected:
    static void SetUpTestSuite() {
        photo_ = new Picture(SmoothPhoto(kWidth, kHeight));
        record_ = new TRANSFER(StyledRecord());
        AddFaces(*record_);
        reference_ = new std::vector<uint8_t>(ApplyWhole(*photo_, *record_, true));
    }
    static void TearDownTestSuite() {
        delete photo_;
        delete record_;
        delete reference_;
    }

    static constexpr size_t kWidth = 1500;
    static constexpr size_t kHeight = 1000;
    static Picture* photo_;
    static TRANSFER* record_;
    static std::vector<uint8_t>* reference_;  // serial, whole image, out of place
};
Picture* ApplyTransferPhoto::photo_ = nullptr;
TRANSFER* ApplyTransferPhoto::record_ = nullptr;
std::vector<uint8_t>* ApplyTransferPhoto::reference_ = nullptr;

TEST_F(ApplyTransferPhoto, ReferenceShowsTheTransferAndTheFaces) {
    // Guards the tests below against comparing two unchanged images.
    EXPECT_GT(CountDifferentBytes(*reference_, photo_->bytes), reference_->size() / 2);
    TRANSFER noFaces = *record_;
    noFaces.faceCorrections.clear();
    EXPECT_GT(CountDifferentBytes(*reference_, ApplyWhole(*photo_, noFaces, true)), 10000u);
}

TEST_F(ApplyTransferPhoto, ParallelMatchesSerial) { EXPECT_TRUE(ApplyWhole(*photo_, *record_) == *reference_); }

TEST_F(ApplyTransferPhoto, InPlaceMatchesOutOfPlace) {
    Picture picture = *photo_;
    const ImagePtr image = Whole(picture);
    ASSERT_EQ(ApplyTransfer(image.get(), *record_, image.get()), STATUS_OK);
    EXPECT_TRUE(picture.bytes == *reference_);
}

TEST_F(ApplyTransferPhoto, CopiedRecordAppliesTheSame) {
    TRANSFER assigned;
    std::unique_ptr<TRANSFER> constructed;
    {
        const TRANSFER original = *record_;
        constructed = std::make_unique<TRANSFER>(original);
        assigned = original;
    }  // the original is gone before either copy is used
    EXPECT_TRUE(ApplyWhole(*photo_, *constructed) == *reference_);
    EXPECT_TRUE(ApplyWhole(*photo_, assigned) == *reference_);
}

// Random tilings, tiles applied in random order, each tile a separate image
// object over the shared source and destination buffers; cuts are forced
// through both face boxes. Once out of place, once in place.
TEST_F(ApplyTransferPhoto, TilesMatchWholeImage) {
    std::mt19937 random(20240611);
    for (int tiling = 0; tiling < 4; ++tiling) {
        auto cuts = [&](size_t extent, const std::vector<float>& through) {
            std::vector<size_t> positions = {0, extent};
            std::uniform_int_distribution<size_t> position(1, extent - 1);
            const int count = std::uniform_int_distribution<int>(1, 6)(random);
            for (int i = 0; i < count; ++i) positions.push_back(position(random));
            for (float t : through) positions.push_back(static_cast<size_t>(t * static_cast<float>(extent)));
            std::sort(positions.begin(), positions.end());
            positions.erase(std::unique(positions.begin(), positions.end()), positions.end());
            return positions;
        };
        const std::vector<size_t> xs = cuts(kWidth, {record_->faceCorrections[0].centreX,
                                                     record_->faceCorrections[1].centreX + 0.013f});
        const std::vector<size_t> ys = cuts(kHeight, {record_->faceCorrections[0].centreY - 0.021f,
                                                      record_->faceCorrections[1].centreY});
        struct Rect {
            size_t left, top, width, height;
        };
        std::vector<Rect> tiles;
        for (size_t j = 0; j + 1 < ys.size(); ++j) {
            for (size_t i = 0; i + 1 < xs.size(); ++i) tiles.push_back({xs[i], ys[j], xs[i + 1] - xs[i], ys[j + 1] - ys[j]});
        }
        std::shuffle(tiles.begin(), tiles.end(), random);

        const bool inPlace = tiling % 2 == 1;
        Picture source = *photo_;
        Picture separate{kWidth, kHeight, 3, std::vector<uint8_t>(photo_->bytes.size(), 0)};
        Picture& destination = inPlace ? source : separate;
        size_t failures = 0;
        testing::internal::CaptureStdout();
        for (const Rect& r : tiles) {
            const ImagePtr in = Tile(source, r.left, r.top, r.width, r.height);
            const ImagePtr out = Tile(destination, r.left, r.top, r.width, r.height);
            failures += ApplyTransfer(in.get(), *record_, out.get()) == STATUS_OK ? 0 : 1;
        }
        testing::internal::GetCapturedStdout();
        ASSERT_EQ(failures, 0u);
        EXPECT_TRUE(destination.bytes == *reference_)
            << "tiling " << tiling << ": " << tiles.size() << " tiles, "
            << CountDifferentBytes(destination.bytes, *reference_) << " bytes differ";
    }
}

}  // namespace
}  // namespace vora
