#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>
#include <vector>

#include "color/TransferColours.h"

namespace vora {
namespace {

// Records outside what compute produces, where the vector lanes must still
// follow the scalar chain's comparisons: NaN and infinite means and maps, a
// tone curve beyond [0, 1] with NaN entries, reversed and NaN lightness bounds.
std::vector<TRANSFER> HostileTransfers() {
    const float nan = std::numeric_limits<float>::quiet_NaN(), inf = std::numeric_limits<float>::infinity();
    TRANSFER base{0, 0, {4.5f, -7.25f}, {-3, 12.5f}, {1.25f, 0.35f, -0.6f, 0.8f}, {}, 0.08f, 0.93f, {}};
    for (int i = 0; i < 257; ++i) base.toneCurve[i] = 1.4f * std::sin(i * 0.05f);
    std::vector<TRANSFER> transfers(5, base);
    transfers[0].chromaMatrix[1] = nan;
    transfers[1].contentMean[0] = inf;
    transfers[1].styleMean[1] = -inf;
    transfers[2].toneCurve[40] = transfers[2].toneCurve[255] = nan;
    transfers[2].chromaMatrix[0] = 1e30f;
    transfers[3].lightnessLow = 0.9f;
    transfers[3].lightnessHigh = 0.2f;
    transfers[4].lightnessLow = transfers[4].lightnessHigh = nan;
    return transfers;
}

// Every kernel this machine can run gives TransferColour's bits, on runs cut
// at lengths that cross the stage runs and the vector lanes' padding.
TEST(TransferColours, EveryKernelGivesTheColourFunctionsBits) {
    std::mt19937 random(20261125);
    std::vector<uint32_t> colours(1 << 16);
    for (uint32_t& colour : colours) colour = random() & 0xFFFFFFu;
    colours[0] = 0, colours[1] = 0xFFFFFF;
    for (const TRANSFER& transfer : HostileTransfers()) {
        std::vector<uint32_t> expected;
        for (uint32_t colour : colours) expected.push_back(TransferColour(LabByTables::Get(), transfer, colour));
        for (VectorKernel kernel : {VectorKernel::Scalar, VectorKernel::Avx2}) {
            if (!LabByTables::Available(kernel)) continue;
            SCOPED_TRACE(LabByTables::Name(kernel));
            std::vector<uint32_t> outputs(colours.size(), 0xFF000000u);
            const size_t runs[] = {1, 7, 8, 9, 255, 256, 257, 512, 3001};
            for (size_t first = 0, i = 0; first < colours.size(); first += runs[i++ % std::size(runs)]) {
                const size_t count = std::min(runs[i % std::size(runs)], colours.size() - first);
                TransferColours(kernel, transfer, &colours[first], count, &outputs[first]);
            }
            EXPECT_EQ(outputs, expected);
        }
    }
}

}  // namespace
}  // namespace vora
