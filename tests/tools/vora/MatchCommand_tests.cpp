// match computes what the library computes, from a style photo or a database style.

#include <string>

#include <gtest/gtest.h>

#include "tools/vora/CliSupport.h"
#include "vora/TransferJson.h"

namespace {

using namespace vora::clitest;

TEST_F(CliTest, MatchGivesTheLibrarysTransfer) {
    cv::Mat style = SyntheticPhotoRgb(90, 200, 3);
    WriteRgb(m_work + "/s.png", style);
    const std::string& m = m_modelDir;
    ASSERT_EQ(Run({"match", "photo.png", "s.png", "m.png", "--model", m, "--solve", "0.5", "--json", "m.json"}).status,
              0);
    ASSERT_EQ(Run({"match", "photo.png", "--style-index", "11", "i.png", "--model", m, "--json", "i.json"}).status, 0);

    vora::VoraParameters params;
    params.solveFactor = 0.5f;
    vora::TRANSFER byImage, byIndex;
    ImageHandle content(m_photo), styleImage(style);
    ASSERT_EQ(m_api.compute_transfer(content.get(), styleImage.get(), byImage, params), vora::STATUS_OK);
    ASSERT_EQ(m_api.compute_transfer(content.get(), 11, byIndex, vora::VoraParameters()), vora::STATUS_OK);
    EXPECT_TRUE(SameRecord(vora::cli::ReadTransfersFile(m_work + "/m.json").transfers[0], byImage));
    EXPECT_TRUE(SameRecord(vora::cli::ReadTransfersFile(m_work + "/i.json").transfers[0], byIndex));
    EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/m.png"), ApplyDirect(m_api, m_photo, byImage)));
    EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/i.png"), ApplyDirect(m_api, m_photo, byIndex)));
}

}  // namespace
