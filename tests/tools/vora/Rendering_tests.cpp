// --strength mixes each byte of a rendering with the original, as documented.

#include <string>

#include <gtest/gtest.h>

#include "tools/vora/CliSupport.h"
#include "vora/TransferJson.h"

namespace {

using namespace vora::clitest;

TEST_F(CliTest, StrengthMixesEachByteWithTheOriginal) {
    ASSERT_TRUE(WriteTransfers());
    const vora::TRANSFER t = vora::cli::ReadTransfersFile(m_work + "/t.json").transfers[0];
    const cv::Mat full = ApplyDirect(m_api, m_photo, t);
    for (const char* strength : {"0", "0.35", "1"}) {
        SCOPED_TRACE(strength);
        const std::string out = std::string("s") + strength + ".png";
        const RunResult r = Run({"apply", "photo.png", "t.json", out, "--strength", strength});
        ASSERT_EQ(r.status, 0) << r.err;
        EXPECT_TRUE(SameBytes(ReadRgb(m_work + "/" + out), Mixed(m_photo, full, std::stod(strength))));
    }
    ASSERT_FALSE(SameBytes(full, m_photo));  // so that strength 0 is a real test
    for (const char* bad : {"1.5", "-0.1", "nan", "half"})
        ExpectRefused({"apply", "photo.png", "t.json", "o.png", "--strength", bad}, 2, "--strength");
}

}  // namespace
