#include "modelkit/ModelBuilder.h"

#include <algorithm>
#include <cmath>
#include <fstream>
#include <map>
#include <tuple>

#include <gmock/gmock.h>
#include <opencv2/imgcodecs.hpp>

#include "KitTesting.h"
#include "model/Engine.h"
#include "model/FeatureNetwork.h"
#include "model/StyleDatabase.h"
#include "modelkit/Photos.h"
#include "modelkit/StyleDistance.h"
#include "semantic/NetworkInput.h"
#include "transfer/ColourStatistics.h"

using namespace vora;
using namespace vora::modelkit;
using namespace kit_testing;

namespace {

// Style photos in several formats, each with the 8-bit BGR image it must be
// read as; names sort as listed.
std::vector<cv::Mat> WriteStyles(const fs::path& dir) {
    cv::Mat grey, greyBgr, deep, alpha(96, 128, CV_8U), withAlpha;
    cv::cvtColor(Scene(2), grey, cv::COLOR_BGR2GRAY);
    cv::cvtColor(grey, greyBgr, cv::COLOR_GRAY2BGR);
    Scene(3).convertTo(deep, CV_16U, 257.0, 100.0);  // reduces to the nearest 8-bit value
    cv::randu(alpha, 0, 256);
    cv::merge(std::vector<cv::Mat>{Scene(4), alpha}, withAlpha);
    std::vector<cv::Mat> asRead;
    for (const auto& [name, written, expected] : std::vector<std::tuple<std::string, cv::Mat, cv::Mat>>{
             {"a_plain.png", Scene(1), Scene(1)},         {"b_grey.png", grey, greyBgr},
             {"c_deep.png", deep, Scene(3)},              {"d_alpha.png", withAlpha, Scene(4)},
             {"e_tiff.TIF", Scene(5), Scene(5)},          {"f_lossless.webp", Scene(6, 130, 90), Scene(6, 130, 90)}}) {
        EXPECT_TRUE(cv::imwrite((dir / name).string(), written, {cv::IMWRITE_WEBP_QUALITY, 101})) << name;
        asRead.push_back(expected);
    }
    std::ofstream(dir / "notes.txt") << "not a photo";  // ignored
    return asRead;
}

// The style set and its default model, built once for the tests that only
// read them, and that model as the library loads it.
struct Built {
    TempDir styles, model;
    std::vector<cv::Mat> asRead = WriteStyles(styles.path);
    std::vector<double> progress;
    Engine engine;
    Built() {
        BuildModel({styles.path.string(), "", model.path.string(), 0,
                    [this](double fraction, const std::string&) { progress.push_back(fraction); }, nullptr});
        engine.LoadModel(model.path.string() + "/");
    }
};

const Built& Shared() {
    static const Built built;
    return built;
}

// Every file under dir, by relative path, with its bytes.
std::map<std::string, std::string> Files(const fs::path& dir) {
    std::map<std::string, std::string> files;
    for (const auto& entry : fs::recursive_directory_iterator(dir))
        if (entry.is_regular_file()) files[fs::relative(entry.path(), dir).string()] = ReadBytes(entry.path());
    return files;
}

}  // namespace

TEST(ModelBuilder, SameInputsGiveSameBytesInTheDocumentedLayouts) {
    const Built& built = Shared();
    const TempDir again;
    Build(built.styles.path, again.path);
    const std::map<std::string, std::string> files = Files(built.model.path);
    EXPECT_EQ(files.size(), 6u);  // no staging leftovers
    EXPECT_TRUE(files == Files(again.path));

    // The library loads the model, and no file holds more than its header
    // promises. Six photos, six content samples each; one cluster per ten samples.
    EXPECT_TRUE(built.engine.CanRankStyles());
    EXPECT_EQ(built.engine.clusterCount, 4);
    for (const auto& [file, size] : std::map<std::string, size_t>{{kClusterFileName, 4 + 2048 * 4},
                                                                  {kStyleFileName, 4 + 152 * 6},
                                                                  {kScoresFileName, 8 + 4 * 4 * 6},
                                                                  {kDistanceFileName, 4 + 4 * 21}})
        EXPECT_EQ(files.at(file).size(), size) << file;
    const std::vector<double>& progress = built.progress;
    EXPECT_TRUE(!progress.empty() && progress.back() == 1.0 && std::is_sorted(progress.begin(), progress.end()));
}

TEST(ModelBuilder, RecordsAndDistancesComeFromEachPhotosColours) {
    const Built& built = Shared();
    // Records in file-name order, the 38 stored words of each: the library's
    // statistics of the photo as read (grey expanded, 16-bit reduced, alpha dropped).
    const std::vector<ColourStats>& stored = built.engine.styleRecords;
    const size_t n = built.asRead.size();
    ASSERT_EQ(stored.size(), n);
    for (size_t s = 0; s < n; ++s) {
        ColourStats expected{};
        SummariseColours(built.asRead[s], ChannelOrder::Bgr, expected);
        for (int w = 0; w < 38; ++w) EXPECT_EQ(stored[s].data()[w], expected.data()[w]) << "style " << s << " word " << w;
    }
    // The upper triangle, as the library reads it back into a full matrix.
    for (size_t i = 0; i < n; ++i)
        for (size_t j = 0; j < n; ++j)
            EXPECT_EQ(built.engine.styleDistances[i][j], i == j ? 0.0f : float(StyleDistance(stored[i], stored[j])))
                << i << "," << j;
}

TEST(StyleDistance, ReadsInLabUnits) {
    ColourStats a{};
    for (int i = 0; i < 32; ++i) a.lightness[i] = i / 31.0f;
    a.chromaSqrtCov[0] = a.chromaSqrtCov[3] = 10.0f;
    ColourStats cast = a, vivid = a, brighter = a;
    cast.chromaMean[0] += 9.0f;  // a colour cast of 15 units
    cast.chromaMean[1] += 12.0f;
    vivid.chromaSqrtCov[0] = vivid.chromaSqrtCov[3] = 25.0f;  // chroma spread up by 15
    for (float& l : brighter.lightness) l += 0.15f;         // every tone 15 L* higher
    // (Symmetry is held by RecordsAndDistancesComeFromEachPhotosColours, on both triangles.)
    for (const ColourStats* b : {&cast, &vivid, &brighter}) EXPECT_NEAR(std::sqrt(StyleDistance(a, *b)), 15.0, 1e-4);
}

TEST(ModelBuilder, NetworkLoadsAndEachStyleScoresBestInItsNearestCluster) {
    const Built& built = Shared();
    const Engine& engine = built.engine;
    ASSERT_TRUE(engine.network && engine.network->hasMemoryDataInput());
    std::string scores = ReadBytes(built.model.path / kScoresFileName);  // the library keeps only rankings
    const cv::Mat scoreRows(engine.clusterCount, engine.styleCount, CV_32F, &scores[8]);
    const std::vector<std::string> photos = ListPhotos(built.styles.path.string());
    for (int s = 0; s < engine.styleCount; ++s) {
        cv::Mat canvas;
        ASSERT_TRUE(PrepareNetworkImage(ReadPhotoBgr(photos[s]), canvas, kNetworkImageSize, kNetworkInputSize));
        const std::vector<float> feature = engine.network->Forward(canvas);
        ASSERT_EQ(feature.size(), 512u);
        std::vector<double> distances;
        for (const ClusterCentre& centre : engine.clusterCentres)
            distances.push_back(cv::norm(cv::Mat(std::vector<float>(centre.begin(), centre.end())), cv::Mat(feature)));
        cv::Point best;
        cv::minMaxLoc(scoreRows.col(s), nullptr, nullptr, nullptr, &best);
        EXPECT_EQ(best.y, std::min_element(distances.begin(), distances.end()) - distances.begin()) << photos[s];
    }
}

TEST(ModelBuilder, ContentFolderGivesTheClusterSamples) {
    const TempDir content, out;
    for (int i = 0; i < 5; ++i) cv::imwrite((content.path / ("c" + std::to_string(i) + ".jpg")).string(), Scene(20 + i));
    // Five content photos, taken as they are: one cluster by default, five at most.
    for (int clusters : {0, 5}) {
        Build(Shared().styles.path, out.path, clusters, content.path);
        EXPECT_EQ(ReadBytes(out.path / kClusterFileName).size(), 4 + 2048 * size_t(std::max(clusters, 1)));
    }
}

TEST(ModelBuilder, FailuresSayWhatIsWrongAndLeaveTheModelAlone) {
    const Built& built = Shared();
    const std::map<std::string, std::string> before = Files(built.model.path);
    const TempDir empty, broken;
    fs::copy(built.styles.path, broken.path);
    std::ofstream(broken.path / "zz_broken.jpg") << "these bytes are no JPEG";
    const std::string model = built.model.path.string(), good = built.styles.path.string();
    const std::string underFile = (built.model.path / kClusterFileName / "model").string();
    using Case = std::tuple<std::string, std::string, int, std::string>;  // styles, model, clusters, message
    for (const auto& [styles, out, clusters, message] : std::vector<Case>{
             {empty.path.string(), model, 0, "need at least 2 style photos in " + empty.path.string() + ", found 0"},
             {(empty.path / "missing").string(), model, 0, "is not a readable folder"},
             {good, model, 1000, "cannot make 1000 clusters from 36 content samples"},
             {broken.path.string(), model, 0, "cannot read the photo " + (broken.path / "zz_broken.jpg").string()},
             {good, underFile, 0, "cannot create the model folder " + underFile}})
        EXPECT_THAT(([s = styles, o = out, k = clusters] { Build(s, o, k); }),  // bindings cannot be captured
                    testing::ThrowsMessage<std::runtime_error>(testing::HasSubstr(message)));
    // The failed builds left the earlier model as it was, and nothing else.
    EXPECT_TRUE(Files(built.model.path) == before);
}
