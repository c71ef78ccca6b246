// vora apply over many photos: the same bytes as one at a time, existing
// outputs skipped, failures reported without stopping the others.

#include <filesystem>
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "tools/vora/CliSupport.h"

namespace {

using namespace vora::clitest;

TEST_F(CliTest, BatchRendersAsApplyDoesSkipsWhatExistsAndReportsFailures) {
    ASSERT_TRUE(WriteTransfers());
    WriteRgb(m_work + "/b.jpg", m_photo);
    std::ofstream(m_work + "/broken.jpg") << "not an image";
    ASSERT_EQ(Run({"apply", "photo.png", "t.json", "one.png"}).status, 0);
    ASSERT_EQ(Run({"apply", "b.jpg", "t.json", "one.jpg"}).status, 0);

    const std::vector<std::string> batch = {"apply", "photo.png", "b.jpg", "broken.jpg", "t.json:0", "--out-dir", "out"};
    const RunResult first = Run(batch);
    EXPECT_EQ(first.status, 1);
    EXPECT_NE(first.out.find("2 done, 0 skipped, 1 failed"), std::string::npos) << first.out;
    EXPECT_EQ(first.err, "vora: broken.jpg: cannot read image (not a JPEG, PNG, TIFF or WebP file, or damaged)\n");
    EXPECT_EQ(ReadBytes(m_work + "/out/photo.png"), ReadBytes(m_work + "/one.png"));
    EXPECT_EQ(ReadBytes(m_work + "/out/b.jpg"), ReadBytes(m_work + "/one.jpg"));

    const RunResult again = Run(batch);
    EXPECT_EQ(again.status, 1);
    EXPECT_NE(again.out.find("0 done, 2 skipped"), std::string::npos) << again.out;
    std::vector<std::string> forced = batch;
    forced.erase(forced.begin() + 3);  // without the broken photo
    forced.push_back("--force");
    const RunResult replaced = Run(forced);
    EXPECT_EQ(replaced.status, 0) << replaced.err;
    EXPECT_NE(replaced.out.find("2 done, 0 skipped, 0 failed"), std::string::npos) << replaced.out;

    std::filesystem::create_directory(m_work + "/x");
    WriteRgb(m_work + "/x/photo.jpg", m_photo);
    ExpectRefused({"apply", "photo.png", "x/photo.jpg", "t.json", "--out-dir", "o2", "--format", "webp"}, 2,
                  "x/photo.jpg: would be written to o2/photo.webp, as photo.png is");
    ExpectRefused({"apply", "photo.png", "b.jpg", "t.json"}, 2, "several photos need --out-dir DIR");
    ExpectRefused({"apply", "photo.png", "t.json", "--out-dir", "o3", "--jobs", "0"}, 2, "--jobs");
}

}  // namespace
