// inspect names what is wrong with a model, and the commands that read a model
// refuse it with the same words.

#include <algorithm>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "model/ModelFileNames.h"
#include "model/StyleDatabase.h"
#include "tools/vora/CliSupport.h"

namespace {

using vora::fixtures::FixtureOptions;
using vora::fixtures::ModelFixture;
using namespace vora::clitest;

struct BrokenModel {
    std::function<void(FixtureOptions&)> change;
    std::pair<const char*, size_t> truncate;  // a data file and its size, after writing
    const char* mentions;
    const char* suggestSays = nullptr;  // when suggest words it differently
};

TEST_F(CliTest, InspectNamesWhatIsWrongWithEachBrokenModel) {
    using Files = vora::fixtures::NetworkOptions::Files;
    ASSERT_TRUE(WriteTransfers());
    const std::vector<BrokenModel> cases = {
        {[](FixtureOptions& o) { o.writeClusters = false; }, {}, "semantic_cluster_1000.dat is missing"},
        {nullptr, {vora::kStyleFileName, 781},
         "styledb_style_1500.dat is truncated: its header promises 1828 bytes, the file has 781"},
        {nullptr, {vora::kScoresFileName, 6}, "too short to hold its header"},
        {[](FixtureOptions& o) { o.scoreColumns = 10; }, {}, "the scores file has 10 columns but there are 12 styles"},
        {[](FixtureOptions& o) { o.transposeScores = true; }, {}, "rows and columns look swapped"},
        {[](FixtureOptions& o) { o.distanceCount = 11; }, {}, "distances file is for 11 styles but there are 12"},
        {[](FixtureOptions& o) { o.network.files = Files::MissingWeights; }, {}, "caffe_reduce_512_model is missing"},
        {[](FixtureOptions& o) { o.network.files = Files::GarbledDefinition; }, {}, "network does not load"},
        {[](FixtureOptions& o) { o.network.outputs = 100; }, {}, "512", "incomplete"},
        {[](FixtureOptions& o) { o.styles[3].lightness[4] = NAN; }, {},
         "styledb_style_1500.dat holds 1 statistics values that are not finite"},
    };
    for (const BrokenModel& c : cases) {
        SCOPED_TRACE(c.mentions);
        FixtureOptions options = vora::fixtures::RandomDatabase(4, 12, 7);
        if (c.change) c.change(options);
        ModelFixture model(options);
        if (c.truncate.first) vora::fixtures::TruncateFile(model.DataFile(c.truncate.first), c.truncate.second);
        const RunResult r = Run({"inspect", model.modelDir()});
        EXPECT_EQ(r.status, 1);
        EXPECT_NE(r.out.find(c.mentions), std::string::npos) << r.out;
        EXPECT_NE(r.out.find("result: broken"), std::string::npos) << r.out;
        EXPECT_EQ(std::count(r.err.begin(), r.err.end(), '\n'), 1) << r.err;
        ExpectRefused({"suggest", "photo.png", "--model", model.modelDir(), "--faces", "none"}, 1,
                      c.suggestSays ? c.suggestSays : c.mentions);
        // With broken data files the network is loaded alone, not through a
        // facade that would read them; apply examines the files before loading.
        if (c.truncate.first) {
            EXPECT_NE(r.out.find("network: loads (no test computation"), std::string::npos) << r.out;
        }
        if (!c.suggestSays)
            ExpectRefused({"apply", "photo.png", "t.json", "out.png", "--model", model.modelDir()}, 1, c.mentions);
    }

    const RunResult r = Run({"inspect", m_modelDir});
    EXPECT_EQ(r.status, 0) << r.out << r.err;
    for (const char* says : {"result: usable", "4 cluster centres", "best 6 of 12 styles"})
        EXPECT_NE(r.out.find(says), std::string::npos) << r.out;
}

}  // namespace
