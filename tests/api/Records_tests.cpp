#include <gtest/gtest.h>

#include <vora/vora.h>

namespace vora {
namespace {

// Five transfers, unit factors, no faces; faces need both an array and a count;
// copies share the caller's face array.
TEST(VoraParameters, DefaultsFacesAndCopies) {
    const CFaceRect faces[2] = {CFaceRect(0.1, 0.2, 0.3, 0.4), CFaceRect(0.5, 0.6, 0.7, 0.8)};
    VoraParameters params;
    EXPECT_EQ(params.numTransfers, 5u);
    for (float factor : {params.rankingFactor, params.solveFactor, params.limitFactor, params.finishFactor}) {
        EXPECT_EQ(factor, 1.0f);
    }
    EXPECT_TRUE(params.getFaceRects() == nullptr && params.getNumberOfFaceRects() == 0);
    EXPECT_FALSE(params.isVoraParameterHavingFaces());
    params.numFaceRects = 3;
    EXPECT_FALSE(params.isVoraParameterHavingFaces());
    EXPECT_EQ(params.getNumberOfFaceRects(), 3u);
    params.faceRects = faces;
    params.numFaceRects = 0;
    EXPECT_FALSE(params.isVoraParameterHavingFaces());
    params.numFaceRects = 2;
    params.numTransfers = 7;
    EXPECT_TRUE(params.isVoraParameterHavingFaces());
    VoraParameters copy;
    copy = params;
    EXPECT_TRUE(copy.getFaceRects() == faces && copy.getNumberOfFaceRects() == 2 && copy.numTransfers == 7);
}

// Edges are inclusive; emptiness is strict and independent of the area.
TEST(CDoubleRect, AreaAndEmptiness) {
    struct Case {
        CDoubleRect rect;
        double area;
        bool empty;
    };
    for (const Case& c : {Case{CDoubleRect(), 1.0, false}, Case{CDoubleRect(0, 9, 0, 4), 50.0, false},
                          Case{CDoubleRect(5, 4, 0, 0), 0.0, true}, Case{CDoubleRect(0, 0, 3, 2), 0.0, true},
                          Case{CDoubleRect(5, 3, 4, 2), 1.0, true}}) {
        EXPECT_EQ(c.rect.Area(), c.area) << c.rect.left << "," << c.rect.right << "," << c.rect.top;
        EXPECT_EQ(c.rect.Empty(), c.empty) << c.rect.left << "," << c.rect.right << "," << c.rect.top;
    }
}

}  // namespace
}  // namespace vora
