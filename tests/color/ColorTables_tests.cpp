#include <gtest/gtest.h>

#include <cmath>

#include "color/ColorTables.h"

namespace vora {
namespace {

TEST(ColorTables, StatedEntries) {
    EXPECT_EQ(gammaTable[0], 0.0f);
    EXPECT_EQ(gammaTable[1500], 0.21763764f);
    EXPECT_EQ(gammaTable[3000], 1.0f);
    EXPECT_EQ(inverseGammaTable[0], 0.0f);
    EXPECT_EQ(inverseGammaTable[1500], 0.72974002f);
    EXPECT_EQ(inverseGammaTable[3000], 1.0f);
    EXPECT_EQ(labTable[0], 0.13793103f);
    EXPECT_EQ(labTable[1500], 0.79370052f);
    EXPECT_EQ(labTable[3000], 1.0f);
}

TEST(ColorTables, EveryEntryIsItsFormulaRoundedToFloat) {
    for (size_t i = 0; i < kTableSize; ++i) {
        const double x = static_cast<double>(i) / 3000.0;
        ASSERT_EQ(gammaTable[i], static_cast<float>(std::pow(x, 2.2))) << i;
        ASSERT_EQ(inverseGammaTable[i], static_cast<float>(std::pow(x, 1.0 / 2.2))) << i;
        const double lab = x > 0.008856 ? std::cbrt(x) : 7.787037 * x + 16.0 / 116.0;
        ASSERT_EQ(labTable[i], static_cast<float>(lab)) << i;
    }
}

TEST(ColorTables, LookupRoundsHalvesUpward) {
    EXPECT_EQ(TableIndex(0.0f), 0u);
    EXPECT_EQ(TableIndex(1.0f), 3000u);
    EXPECT_EQ(TableIndex(0.5f / 3000.0f), 1u);
    EXPECT_EQ(TableIndex(0.49f / 3000.0f), 0u);
}

}  // namespace
}  // namespace vora
