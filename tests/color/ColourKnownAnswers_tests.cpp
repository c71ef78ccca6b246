#include <gtest/gtest.h>

#include <array>
#include <cmath>

#include "color/ApplyTransfer.h"
#include "color/ColorConversion.h"
#include "support/TestImages.h"

// Answers worked out apart from the kernel, by replaying every rounding step
// of the conversion in other arithmetic (scripts/reference/colour-known-answers.py).
// Written as hex floats, so a transposed chroma map, a swapped channel or an
// index one entry off shows here, not only as a drift in the colour tests.
namespace vora {
namespace {

// Per colour: its Lab (L*/100, a*, b*), and its output under a non-symmetric
// chroma map about means away from zero with a tone curve (i/256)^2 capped at
// 0.5 (steep, then flat), first with a lightness spread, then with
// lightnessLow == lightnessHigh (every pixel takes the curve's entry 255).
struct Answer {
    std::array<int, 3> rgb;
    std::array<float, 3> lab;
    std::array<int, 3> spread, noSpread;
};
const Answer kAnswers[] = {
    {{0, 0, 0}, {-0x1.47ae14p-31f, 0x0.0p+0f, 0x0.0p+0f}, {17, 6, 0}, {122, 119, 91}},
    {{255, 255, 255}, {0x1.p+0f, 0x0.0p+0f, 0x0.0p+0f}, {122, 119, 91}, {122, 119, 91}},
    {{255, 0, 0}, {0x1.1096e2p-1f, 0x1.407098p+6f, 0x1.0d2936p+6f}, {205, 0, 0}, {255, 0, 41}},
    {{0, 255, 0}, {0x1.c12a02p-1f, -0x1.58722ap+6f, 0x1.4cd2cep+6f}, {0, 140, 0}, {0, 140, 0}},
    {{0, 0, 255}, {0x1.4b1530p-2f, 0x1.3bca84p+6f, -0x1.af2a5ep+6f}, {0, 27, 163}, {0, 102, 255}},
    {{200, 150, 90}, {0x1.527c36p-1f, 0x1.72ea58p+3f, 0x1.3c8666p+5f}, {172, 100, 39}, {172, 100, 39}},
    {{17, 94, 201}, {0x1.aae538p-2f, 0x1.41dfe8p+4f, -0x1.f292f6p+5f}, {0, 47, 100}, {0, 124, 191}},
    {{250, 20, 180}, {0x1.1effa2p-1f, 0x1.5e5b88p+6f, -0x1.9e6c7cp+4f}, {174, 0, 124}, {225, 0, 167}},
    {{1, 2, 3}, {-0x1.47ae14p-31f, 0x0.0p+0f, 0x0.0p+0f}, {17, 6, 0}, {122, 119, 91}},
    {{30, 20, 45}, {0x1.bbfcf8p-5f, 0x1.9e45e4p+3f, -0x1.10dedcp+4f}, {18, 0, 13}, {124, 115, 121}},
    {{128, 128, 127}, {0x1.144178p-1f, -0x1.392410p-2f, 0x1.1ad960p-1f}, {76, 73, 49}, {122, 119, 91}},
    {{64, 200, 30}, {0x1.6e5c88p-1f, -0x1.0584a4p+6f, 0x1.0d7af2p+6f}, {50, 136, 0}, {50, 136, 0}},
    {{233, 217, 202}, {0x1.c22712p-1f, 0x1.7a7e88p+1f, 0x1.26e510p+3f}, {136, 115, 80}, {136, 115, 80}},
};

struct LabRgb {
    std::array<float, 3> lab;
    std::array<int, 3> rgb;
};
const LabRgb kToRgb[] = {
    {{0x1.p-1f, 0x1.e00000p+5f, -0x1.400000p+5f}, {182, 73, 186}},
    {{0x1.p-2f, -0x1.e80000p+4f, 0x1.6a0000p+5f}, {31, 70, 0}},
    {{0x1.ccccccp-1f, 0x1.800000p+3f, 0x1.400000p+6f}, {255, 213, 61}},
    {{0x1.99999ap-5f, 0x1.800000p+1f, -0x1.800000p+1f}, {26, 22, 27}},
    {{0x1.666666p-1f, -0x1.180000p+6f, -0x1.400000p+4f}, {0, 200, 204}},
    {{0x1.p+0f, 0x0.0p+0f, 0x0.0p+0f}, {255, 255, 255}},
    {{0x0.0p+0f, 0x0.0p+0f, 0x0.0p+0f}, {0, 0, 0}},
    {{0x1.333334p-1f, 0x1.900000p+6f, 0x1.900000p+6f}, {255, 0, 0}},
    {{-0x1.47ae14p-31f, 0x0.0p+0f, 0x0.0p+0f}, {0, 0, 0}},  // black's own Lab
    {{0x1.p+1f, 0x0.0p+0f, 0x0.0p+0f}, {255, 255, 255}},  // beyond the gamut: clamped, never read past a table
    {{0x1.p-1f, 0x1.2cp+8f, 0x0.0p+0f}, {255, 0, 137}},
    {{NAN, NAN, NAN}, {0, 0, 0}},  // NaN encodes as 0
};

TRANSFER TestTransfer(float low, float high) {
    TRANSFER t{0, 0, {3.5f, -6.25f}, {-2.0f, 9.75f}, {1.125f, 0.375f, -0.25f, 0.875f}, {}, low, high, {}};
    for (int i = 0; i < 257; ++i) t.toneCurve[i] = std::min((i / 256.0f) * (i / 256.0f), 0.5f);
    return t;
}

TEST(ColourKnownAnswers, RgbToLabAndBack) {
    for (const Answer& k : kAnswers) {
        const LabPixel lab = RgbToLab(k.rgb[0], k.rgb[1], k.rgb[2]);
        EXPECT_EQ((std::array<float, 3>{lab.lightness01, lab.a, lab.b}), k.lab)
            << k.rgb[0] << "," << k.rgb[1] << "," << k.rgb[2];
    }
    for (const LabRgb& k : kToRgb) {
        const Rgb8 rgb = LabToRgb(k.lab[0], k.lab[1], k.lab[2]);
        EXPECT_EQ((std::array<int, 3>{rgb.red, rgb.green, rgb.blue}), k.rgb)
            << k.lab[0] << "," << k.lab[1] << "," << k.lab[2];
    }
}

// Through the library's apply, one pixel per answer.
TEST(ColourKnownAnswers, TransferOfOnePixel) {
    constexpr size_t kCount = std::size(kAnswers);
    for (const bool spread : {true, false}) {
        const TRANSFER transfer = spread ? TestTransfer(0.125f, 0.875f) : TestTransfer(0.4f, 0.4f);
        cv::Mat in(1, kCount, CV_8UC3), out(1, kCount, CV_8UC3, cv::Scalar::all(7));
        for (size_t i = 0; i < kCount; ++i)
            in.at<cv::Vec3b>(0, i) = cv::Vec3b(kAnswers[i].rgb[0], kAnswers[i].rgb[1], kAnswers[i].rgb[2]);
        ApplyTransfer(testimages::ImageHandle(in).get(), transfer, testimages::ImageHandle(out).get());
        for (size_t i = 0; i < kCount; ++i) {
            const cv::Vec3b got = out.at<cv::Vec3b>(0, i);
            EXPECT_EQ((std::array<int, 3>{got[0], got[1], got[2]}), spread ? kAnswers[i].spread : kAnswers[i].noSpread)
                << kAnswers[i].rgb[0] << "," << kAnswers[i].rgb[1] << "," << kAnswers[i].rgb[2];
        }
    }
}

}  // namespace
}  // namespace vora
