// Photos tagged with other colour profiles, through the tool: converted to
// sRGB as Little CMS's own tools convert them, or kept on request.

#include <cstdlib>
#include <filesystem>
#include <string>

#include <gtest/gtest.h>
#include <opencv2/core.hpp>

#include "tools/vora/CliSupport.h"

namespace {

using namespace vora::clitest;

const char* const kAdobeProfile = "/usr/share/color/icc/compatibleWithAdobeRGB1998.icc";

TEST_F(CliTest, TaggedPhotoRestylesAsItsSrgbConversionAndCanKeepItsProfile) {
    if (std::system("command -v tificc >/dev/null") != 0 || !std::filesystem::exists(kAdobeProfile))
        GTEST_SKIP() << "needs tificc (liblcms2-utils) and " << kAdobeProfile << " (icc-profiles-free)";
    ASSERT_TRUE(WriteTransfers());
    WriteRgb(m_work + "/orig.tif", m_photo);
    const std::string here = "cd '" + m_work + "' && ";
    // The photo in Adobe RGB, tagged; and that file's own conversion to sRGB.
    const std::string toAdobe = std::string("tificc -e -o") + kAdobeProfile + " orig.tif adobe.tif";
    ASSERT_EQ(std::system((here + toAdobe + " && tificc adobe.tif back.tif").c_str()), 0);

    const RunResult tagged = Run({"apply", "adobe.tif", "t.json", "a.png", "--model", m_modelDir});
    ASSERT_EQ(tagged.status, 0) << tagged.err;
    EXPECT_EQ(tagged.err, "vora: adobe.tif: converted from Compatible with Adobe RGB (1998) to sRGB\n");
    const RunResult converted = Run({"apply", "back.tif", "t.json", "b.png", "--model", m_modelDir});
    ASSERT_EQ(converted.status, 0) << converted.err;
    EXPECT_EQ(converted.err, "");
    EXPECT_LE(cv::norm(ReadRgb(m_work + "/a.png"), ReadRgb(m_work + "/b.png"), cv::NORM_INF), 1.0);
    // The tagged photo differs from sRGB: read as sRGB, it would restyle otherwise.
    EXPECT_GT(cv::norm(ReadRgb(m_work + "/adobe.tif"), ReadRgb(m_work + "/back.tif"), cv::NORM_INF), 10.0);
    EXPECT_EQ(ProfileDescription(EmbeddedProfile(m_work + "/a.png")), "sRGB built-in");

    // --keep-profile: written in the input's profile and tagged with it.
    for (const std::string name : {"k.tif", "k.jpg", "k.png", "k.webp"}) {
        SCOPED_TRACE(name);
        ASSERT_EQ(Run({"apply", "adobe.tif", "t.json", name, "--model", m_modelDir, "--keep-profile"}).status, 0);
        EXPECT_EQ(EmbeddedProfile(m_work + "/" + name), ReadBytes(kAdobeProfile));
    }
    ASSERT_EQ(std::system((here + "tificc k.tif k-srgb.tif").c_str()), 0);
    EXPECT_LE(cv::norm(ReadRgb(m_work + "/k-srgb.tif"), ReadRgb(m_work + "/a.png"), cv::NORM_INF), 2.0);
}

}  // namespace
