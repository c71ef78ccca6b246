// Writing outputs: never replacing a file that appeared after the check, and
// sets that appear whole or not at all.

#include <filesystem>
#include <iterator>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/vora/CliSupport.h"
#include "vora/Cli.h"
#include "vora/OutputFiles.h"

namespace {

namespace fs = std::filesystem;
using namespace vora::clitest;

size_t Entries(const std::string& folder) {
    return static_cast<size_t>(std::distance(fs::directory_iterator(folder), fs::directory_iterator()));
}

// A file that appears at the output path after the check is never replaced
// without --force (the rename used to replace it and exit 0); with it, it is.
TEST(OutputFiles, TheFinalStepReplacesOnlyWhenAllowed) {
    const vora::fixtures::TempFolder temp;
    const std::string folder = temp.path(), path = folder + "/out.txt";
    vora::fixtures::WriteBytes(path, "the user's");
    EXPECT_THAT([&] { vora::cli::WriteFileAtomically(path, "ours", false); },
                testing::ThrowsMessage<vora::cli::Failure>(testing::HasSubstr("already exists")));
    EXPECT_EQ(ReadBytes(path), "the user's");
    EXPECT_EQ(Entries(folder), 1u);  // no temporary left
    vora::cli::WriteFileAtomically(path, "ours", true);
    EXPECT_EQ(ReadBytes(path), "ours");
}

// A set appears whole or not at all: in a new folder by one rename, in an
// existing one file by file, taken back when one is in the way; abandoned, it
// leaves nothing.
TEST(OutputFiles, StagedSetsAppearTogetherOrNotAtAll) {
    const vora::fixtures::TempFolder temp;
    const std::string root = temp.path(), out = root + "/set";
    {
        vora::cli::StagingFolder abandoned(out);
        vora::cli::WriteFileAtomically(abandoned.PathFor("a.txt"), "a", false);
    }
    EXPECT_EQ(Entries(root), 0u);
    {
        vora::cli::StagingFolder staging(out);
        vora::cli::WriteFileAtomically(staging.PathFor("a.txt"), "a", false);
        vora::cli::WriteFileAtomically(staging.PathFor("b.txt"), "b", false);
        staging.Commit(false);
    }
    EXPECT_TRUE(ReadBytes(out + "/a.txt") == "a" && ReadBytes(out + "/b.txt") == "b" && Entries(root) == 1u);
    fs::remove(out + "/a.txt");
    {
        vora::cli::StagingFolder staging(out);
        vora::cli::WriteFileAtomically(staging.PathFor("a.txt"), "new a", false);
        vora::cli::WriteFileAtomically(staging.PathFor("b.txt"), "new b", false);
        EXPECT_THAT([&] { staging.Commit(false); },
                    testing::ThrowsMessage<vora::cli::Failure>(testing::HasSubstr("nothing was written")));
    }
    EXPECT_TRUE(!fs::exists(out + "/a.txt") && ReadBytes(out + "/b.txt") == "b" && Entries(root) == 1u);
    {
        vora::cli::StagingFolder staging(out);
        vora::cli::WriteFileAtomically(staging.PathFor("b.txt"), "new b", false);
        staging.Commit(true);
    }
    EXPECT_TRUE(ReadBytes(out + "/b.txt") == "new b" && Entries(out) == 1u && Entries(root) == 1u);
    {
        vora::cli::StagingFolder staging(root + "/new/deeper/set");  // parents made as needed
        vora::cli::WriteFileAtomically(staging.PathFor("c.txt"), "c", false);
        staging.Commit(false);
    }
    EXPECT_EQ(ReadBytes(root + "/new/deeper/set/c.txt"), "c");
}

}  // namespace
