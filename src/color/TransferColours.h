#pragma once

// The colour function of a transfer: the output of a pixel outside every face
// box, which depends on its colour alone. Apply's cached kernel evaluates it
// once per colour it has not seen, a batch of colours at a time.

#include <cstddef>
#include <cstdint>
#include <functional>

#include <vora/vora.h>

#include "color/ColorConversion.h"
#include "color/LabByTables.h"
#include "color/PixelTransfer.h"

namespace vora {

// Colours are packed as R << 16 | G << 8 | B, and so are the outputs.
inline uint32_t PackRgb(uint8_t red, uint8_t green, uint8_t blue) {
    return static_cast<uint32_t>(red) << 16 | static_cast<uint32_t>(green) << 8 | blue;
}

// One colour: the plain kernel's chain without the face step. The conversion
// by tables has RgbToLab's bits for every colour.
inline uint32_t TransferColour(const LabByTables& toLab, const TRANSFER& transfer, uint32_t colour) {
    std::size_t lightnessEntry;
    const LabPixel lab = toLab(static_cast<uint8_t>(colour >> 16), static_cast<uint8_t>(colour >> 8),
                               static_cast<uint8_t>(colour), lightnessEntry);
    const float lightness = ToneCurveLookup(
        transfer.toneCurve, NormaliseLightness(lab.lightness01, transfer.lightnessLow, transfer.lightnessHigh));
    const ChromaPixel chroma = MapChroma(transfer.contentMean, transfer.chromaMatrix, transfer.styleMean, lab.a, lab.b);
    const Rgb8 rgb = LabToRgb(lightness, chroma.a, chroma.b);
    return PackRgb(rgb.red, rgb.green, rgb.blue);
}

// Rewrites lightness[0, count) of colours [first, first + count) of a call,
// given their lightness after the tone curve and their mapped chroma a, b.
using LightnessLift =
    std::function<void(std::size_t first, std::size_t count, float* lightness, const float* a, const float* b)>;

// outputs[i] = TransferColour(colours[i]) for i < count, bit for bit, in
// stages over short runs of colours (the chain of one colour is a long
// latency chain; independent colours side by side keep the core busy). The
// Avx2 kernel runs the lightness, chroma and Lab-to-RGB stages eight colours
// at a time, each operation the scalar one on eight lanes; it must be
// Available. A `lift` runs between the transfer and the conversion back to
// RGB, where the plain kernel lifts faces: pixels inside face boxes take this
// form, their colours and positions side by side.
void TransferColours(VectorKernel kernel, const TRANSFER& transfer, const uint32_t* colours, std::size_t count,
                     uint32_t* outputs, const LightnessLift* lift = nullptr);

}  // namespace vora
