#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <iterator>
#include <string>
#include <utility>
#include <vector>

#include "color/ColorConversion.h"
#include "color/LabByTables.h"
#include "color/ColorTables.h"

namespace vora {
namespace {

// Every kernel this machine can run gives the reference's a*, b* and lightness
// entries for every 24-bit colour, in both byte orders. Runs are cut at odd
// lengths so that the vector kernels' scalar tails and unaligned starts are
// crossed too.
TEST(ColorConversion, EveryChromaKernelEqualsTheReferenceForEveryColour) {
    const LabByTables& tables = LabByTables::Get();
    constexpr uint32_t kColours = 1u << 24;
    std::vector<uint8_t> pixels(3 * size_t{kColours} + 1);  // one byte of offset: unaligned rows
    std::vector<float> expectedPairs(2 * size_t{kColours});
    std::vector<int64_t> expectedCounts(kTableSize, 0);
    for (uint32_t rgb = 0; rgb < kColours; ++rgb) {
        uint8_t* pixel = &pixels[1 + 3 * size_t{rgb}];
        pixel[0] = rgb >> 16, pixel[1] = (rgb >> 8) & 255, pixel[2] = rgb & 255;
        size_t entry;
        const LabPixel lab = RgbToLab(pixel[0], pixel[1], pixel[2], entry);
        expectedPairs[2 * size_t{rgb}] = lab.a, expectedPairs[2 * size_t{rgb} + 1] = lab.b;
        ++expectedCounts[entry];
    }
    for (VectorKernel kernel : {VectorKernel::Scalar, VectorKernel::Avx2}) {
        if (!LabByTables::Available(kernel)) continue;
        for (ChannelOrder order : {ChannelOrder::Rgb, ChannelOrder::Bgr}) {
            SCOPED_TRACE(std::string(LabByTables::Name(kernel)) + (order == ChannelOrder::Rgb ? " rgb" : " bgr"));
            if (order == ChannelOrder::Bgr)  // the same colours with red and blue exchanged in memory
                for (size_t i = 1; i < pixels.size(); i += 3) std::swap(pixels[i], pixels[i + 2]);
            std::vector<float> pairs(expectedPairs.size(), -1.0f);
            std::vector<int64_t> counts(kTableSize, 0);
            const size_t runs[] = {1, 2, 3, 4, 5, 7, 8, 9, 1009, 4099};
            for (size_t first = 0, i = 0; first < kColours; ++i) {
                const size_t count = std::min(runs[i % std::size(runs)], kColours - first);
                tables.ChromaOfPixels(kernel, &pixels[1 + 3 * first], count, order, &pairs[2 * first], counts.data());
                first += count;
            }
            ASSERT_EQ(std::memcmp(pairs.data(), expectedPairs.data(), pairs.size() * sizeof(float)), 0);
            EXPECT_EQ(counts, expectedCounts);
            if (order == ChannelOrder::Bgr)
                for (size_t i = 1; i < pixels.size(); i += 3) std::swap(pixels[i], pixels[i + 2]);
        }
    }
}

}  // namespace
}  // namespace vora
