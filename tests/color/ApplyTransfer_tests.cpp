#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "color/ApplyTransfer.h"
#include "color/ColorConversion.h"
#include "support/TestImages.h"

namespace vora {
namespace {

using testimages::Tile;

// The styled record differs from the identity in every term and has two overlapping faces.
TRANSFER Record(bool styled, bool faces = true) {
    TRANSFER t = styled ? TRANSFER{0, 0, {4.5f, -7.25f}, {-3, 12.5f}, {0.9f, 0.35f, -0.2f, 1.15f}, {}, 0.08f, 0.93f, {}}
                        : TRANSFER{0, 0, {0, 0}, {0, 0}, {1, 0, 0, 1}, {}, 0.0f, 1.0f, {}};
    for (int i = 0; i < 257; ++i) {
        const float x = std::min(i / 255.0f, 1.0f);
        t.toneCurve[i] = styled ? x * x * (3.0f - 2.0f * x) : x;
    }
    if (styled && faces) {
        t.faceCorrections = {{0.45f, 0.37f, 0.05f, 0.07f, 0.35f, 18, 20, 0.6f},
                             {0.52f, 0.41f, 0.04f, 0.05f, 0.4f, 10, 15, 0.75f}};
    }
    return t;
}

// Out of place into a destination of 7s; a whole image prints the faces line if there are faces.
cv::Mat ApplyWhole(const cv::Mat& source, const TRANSFER& transfer, bool serial = false) {
    cv::Mat in = source.clone(), out(source.size(), source.type(), cv::Scalar::all(7));
    testing::internal::CaptureStdout();
    const testimages::ImageHandle inHandle(in), outHandle(out);
    if (serial)
        ApplyTransferSerial(inHandle.get(), transfer, outHandle.get());
    else
        ApplyTransfer(inHandle.get(), transfer, outHandle.get());
    const size_t faces = transfer.faceCorrections.size();
    EXPECT_EQ(testing::internal::GetCapturedStdout(), faces ? "Correct " + std::to_string(faces) + " faces!!\n" : "");
    return out;
}
int DifferentBytes(const cv::Mat& a, const cv::Mat& b) { return cv::countNonZero(cv::Mat(a != b).reshape(1)); }

// Pixel by pixel: the identity record keeps a grey's round trip through the
// tables; a zero lightness spread gives toneCurve[255] (the guard entry 256 is
// read with weight 0). Bytes 0..2 are R, G, B; the destination's byte 3 stays.
TEST(ApplyTransfer, KnownAnswers) {
    TRANSFER identity = Record(false), flat = identity;
    flat.lightnessLow = flat.lightnessHigh = 0.4f;
    flat.toneCurve[255] = 0.3f;
    flat.toneCurve[256] = 0.9f;
    cv::Mat source(8, 256, CV_8UC4);
    cv::randu(source, cv::Scalar::all(0), cv::Scalar::all(256));
    for (int v = 0; v < 256; ++v) source.at<cv::Vec4b>(0, v) = cv::Vec4b(v, v, v, 0);  // row 0: greys
    for (const TRANSFER* t : {&identity, &flat}) {
        const cv::Mat result = ApplyWhole(source, *t);
        for (int i = 0; i < (t == &identity ? 256 : 256 * 8); ++i) {
            const cv::Vec4b in = source.at<cv::Vec4b>(i / 256, i % 256);
            const LabPixel lab = RgbToLab(in[0], in[1], in[2]);
            const Rgb8 e = LabToRgb(t == &identity ? lab.lightness01 : 0.3f, lab.a, lab.b);
            ASSERT_EQ(result.at<cv::Vec4b>(i / 256, i % 256), cv::Vec4b(e.red, e.green, e.blue, 7)) << "pixel " << i;
        }
    }
}

// A face whose box is exactly [3/16, 13/16] both ways: rows and columns 3 and 13 lie on its edge.
TEST(ApplyTransfer, FaceBoxEdgeIsOutside) {
    const cv::Mat grey(16, 16, CV_8UC3, cv::Scalar::all(70));
    TRANSFER lifted = Record(false);
    lifted.faceCorrections.push_back(FaceCorrection{0.5f, 0.5f, 0.125f, 0.125f, 0.3f, 0.0f, 0.0f, 0.5f});
    const cv::Mat with = ApplyWhole(grey, lifted), without = ApplyWhole(grey, Record(false)), changed = with != without;
    EXPECT_EQ(cv::countNonZero(changed.reshape(1)), cv::countNonZero(changed(cv::Rect(4, 4, 9, 9)).reshape(1)));
    EXPECT_GT(with.at<cv::Vec3b>(8, 4)[0], without.at<cv::Vec3b>(8, 4)[0]);  // next to the edge the lift shows
    EXPECT_GT(with.at<cv::Vec3b>(8, 8)[0], without.at<cv::Vec3b>(8, 8)[0] + 20);
}

// An image whose tilings below cut both face boxes of the styled record, and
// its bytes from a serial whole-image apply, made once for the tests below.
const cv::Mat& TilingPhoto() {
    static const cv::Mat photo = testimages::SyntheticPhotoRgb(1000, 1500);
    return photo;
}
const cv::Mat& SerialReference() {
    static const cv::Mat reference = ApplyWhole(TilingPhoto(), Record(true), true);
    return reference;
}

// Random tilings whose cuts cross both face boxes.
std::vector<std::vector<cv::Rect>> RandomTilings() {
    std::mt19937 random(20240611);
    std::vector<std::vector<cv::Rect>> tilings;
    for (int tiling = 0; tiling < 3; ++tiling) tilings.push_back(testimages::RandomTiling1500x1000(random, tiling + 2));
    return tilings;
}

// Applies the record tile by tile, in place or into a zeroed image; only the
// tile at the origin prints.
cv::Mat ApplyTiled(const TRANSFER& record, const std::vector<cv::Rect>& tiles, bool inPlace) {
    cv::Mat source = TilingPhoto().clone(), separate(source.size(), CV_8UC3, cv::Scalar::all(0));
    cv::Mat& destination = inPlace ? source : separate;
    testing::internal::CaptureStdout();
    for (const cv::Rect& r : tiles) ApplyTransfer(Tile(source, r).get(), record, Tile(destination, r).get());
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "Correct 2 faces!!\n");
    return destination;
}

// Guards the tests below against comparing unchanged images: the transfer
// and the faces both show in the reference.
TEST(ApplyTransfer, ParallelGivesTheSerialBytes) {
    EXPECT_GT(DifferentBytes(SerialReference(), TilingPhoto()), TilingPhoto().total() * 3 / 2);
    EXPECT_GT(DifferentBytes(SerialReference(), ApplyWhole(TilingPhoto(), Record(true, false), true)), 10000);
    EXPECT_EQ(DifferentBytes(ApplyWhole(TilingPhoto(), Record(true)), SerialReference()), 0);
}

TEST(ApplyTransfer, TilesInAnyOrderGiveTheWholeImageBytes) {
    for (const std::vector<cv::Rect>& tiles : RandomTilings())
        EXPECT_EQ(DifferentBytes(ApplyTiled(Record(true), tiles, false), SerialReference()), 0) << tiles.size();
}

TEST(ApplyTransfer, TilesInPlaceGiveTheWholeImageBytes) {
    for (const std::vector<cv::Rect>& tiles : RandomTilings())
        EXPECT_EQ(DifferentBytes(ApplyTiled(Record(true), tiles, true), SerialReference()), 0) << tiles.size();
}

// The record is used by value: a copy whose original is gone serves, and
// faces combine by maximum, so their order does not matter.
TEST(ApplyTransfer, ACopiedRecordWithItsFacesReorderedGivesTheSameBytes) {
    TRANSFER record = *std::make_unique<TRANSFER>(Record(true));
    std::swap(record.faceCorrections[0], record.faceCorrections[1]);
    EXPECT_EQ(DifferentBytes(ApplyTiled(record, RandomTilings()[0], false), SerialReference()), 0);
}

}  // namespace
}  // namespace vora
