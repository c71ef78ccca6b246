#include <gtest/gtest.h>

#include <vector>

#include <vora/vora.h>

namespace vora {
namespace {

TEST(VoraParameters, DefaultsAskForFiveTransfersWithoutFaces) {
    const VoraParameters params;
    EXPECT_EQ(params.numTransfers, 5u);
    EXPECT_EQ(params.rankingFactor, 1.0f);
    EXPECT_EQ(params.solveFactor, 1.0f);
    EXPECT_EQ(params.limitFactor, 1.0f);
    EXPECT_EQ(params.finishFactor, 1.0f);
    EXPECT_EQ(params.getFaceRects(), nullptr);
    EXPECT_EQ(params.getNumberOfFaceRects(), 0u);
    EXPECT_FALSE(params.isVoraParameterHavingFaces());
}

TEST(VoraParameters, FacesNeedBothArrayAndCount) {
    std::vector<CFaceRect> faces = {CFaceRect(0.1, 0.2, 0.3, 0.4), CFaceRect(0.5, 0.6, 0.7, 0.8)};
    VoraParameters params;
    params.numFaceRects = 3;  // a count without an array
    EXPECT_FALSE(params.isVoraParameterHavingFaces());
    EXPECT_EQ(params.getNumberOfFaceRects(), 3u);
    params.faceRects = faces.data();  // an array without a count
    params.numFaceRects = 0;
    EXPECT_FALSE(params.isVoraParameterHavingFaces());
    params.numFaceRects = 2;
    EXPECT_TRUE(params.isVoraParameterHavingFaces());

    // Forgetting the faces frees nothing: the caller's array is intact.
    params.SetDefaultFaceRects();
    EXPECT_EQ(params.getFaceRects(), nullptr);
    EXPECT_EQ(params.getNumberOfFaceRects(), 0u);
    EXPECT_EQ(faces[1].left, 0.5);
    EXPECT_EQ(faces[1].bottom, 0.8);
}

TEST(VoraParameters, AssignmentSharesTheFaceArray) {
    const CFaceRect faces[2] = {CFaceRect(0.1, 0.2, 0.3, 0.4), CFaceRect(0.5, 0.6, 0.7, 0.8)};
    VoraParameters source;
    source.numTransfers = 7;
    source.rankingFactor = 2.0f;
    source.solveFactor = 3.0f;
    source.limitFactor = 4.0f;
    source.finishFactor = 5.0f;
    source.faceRects = faces;
    source.numFaceRects = 2;

    VoraParameters copy;
    copy = source;
    EXPECT_EQ(copy.numTransfers, 7u);
    EXPECT_EQ(copy.rankingFactor, 2.0f);
    EXPECT_EQ(copy.solveFactor, 3.0f);
    EXPECT_EQ(copy.limitFactor, 4.0f);
    EXPECT_EQ(copy.finishFactor, 5.0f);
    EXPECT_EQ(copy.getFaceRects(), faces);  // the pointer, not the rectangles
    EXPECT_EQ(copy.getNumberOfFaceRects(), 2u);
}

TEST(CDoubleRect, EdgesAreInclusive) {
    EXPECT_EQ(CDoubleRect().Area(), 1.0);  // all zero
    EXPECT_EQ(CDoubleRect(0, 0, 0, 0).Area(), 1.0);
    EXPECT_FALSE(CDoubleRect(0, 0, 0, 0).Empty());
    EXPECT_EQ(CDoubleRect(0, 9, 0, 4).Area(), 50.0);
}

TEST(CDoubleRect, EmptinessIsStrictAndIndependentOfArea) {
    EXPECT_TRUE(CDoubleRect(5, 4, 0, 0).Empty());
    EXPECT_TRUE(CDoubleRect(0, 0, 3, 2).Empty());
    EXPECT_FALSE(CDoubleRect(1, 1, 2, 2).Empty());
    // Both spans reversed: empty, yet the product of the two negative spans is positive.
    const CDoubleRect reversed(5, 3, 4, 2);
    EXPECT_TRUE(reversed.Empty());
    EXPECT_EQ(reversed.Area(), 1.0);
}

}  // namespace
}  // namespace vora
