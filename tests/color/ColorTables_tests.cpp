#include <gtest/gtest.h>

#include <cmath>

#include "color/ColorTables.h"

namespace vora {
namespace {

TEST(ColorTables, EveryEntryIsItsDoubleFormulaRoundedToFloat) {
    const float* tables[3] = {gammaTable, inverseGammaTable, labTable};
    const float stated[3][3] = {{0.0f, 0.21763764f, 1.0f}, {0.0f, 0.72974002f, 1.0f}, {0.13793103f, 0.79370052f, 1.0f}};
    for (int k = 0; k < 9; ++k) EXPECT_EQ(tables[k / 3][k % 3 * 1500], stated[k / 3][k % 3]) << k;
    for (size_t i = 0; i < kTableSize; ++i) {
        const double x = static_cast<double>(i) / 3000.0;
        ASSERT_EQ(gammaTable[i], static_cast<float>(std::pow(x, 2.2))) << i;
        ASSERT_EQ(inverseGammaTable[i], static_cast<float>(std::pow(x, 1.0 / 2.2))) << i;
        ASSERT_EQ(labTable[i], static_cast<float>(x > 0.008856 ? std::cbrt(x) : 7.787037 * x + 16.0 / 116.0)) << i;
    }
}

}  // namespace
}  // namespace vora
