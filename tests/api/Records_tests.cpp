#include <gtest/gtest.h>

#include <vora/vora.h>

namespace vora {
namespace {

// Five transfers, unit factors, no faces; faces need both an array and a count;
// copies share the caller's face array.
TEST(VoraParameters, DefaultsFacesAndCopies) {
    const CFaceRect faces[2] = {CFaceRect(0.1, 0.2, 0.3, 0.4), CFaceRect(0.5, 0.6, 0.7, 0.8)};
    VoraParameters params;
    EXPECT_TRUE(params.numTransfers == 5 && params.getFaceRects() == nullptr && params.getNumberOfFaceRects() == 0);
    for (float factor : {params.rankingFactor, params.solveFactor, params.limitFactor, params.finishFactor})
        EXPECT_EQ(factor, 1.0f);
    params.numFaceRects = 3;  // a count without an array
    EXPECT_FALSE(params.isVoraParameterHavingFaces());
    params.faceRects = faces;
    params.numFaceRects = 0;  // an array without a count
    EXPECT_FALSE(params.isVoraParameterHavingFaces());
    params.numFaceRects = 2;
    params.numTransfers = 7;
    VoraParameters copy;
    copy = params;
    EXPECT_TRUE(copy.isVoraParameterHavingFaces() && copy.getFaceRects() == faces && copy.getNumberOfFaceRects() == 2 &&
                copy.numTransfers == 7);
}

}  // namespace
}  // namespace vora
