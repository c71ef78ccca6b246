#include "modelkit/ModelBuilder.h"

#include <algorithm>
#include <cmath>
#include <map>
#include <tuple>

#include <opencv2/imgcodecs.hpp>

#include "KitTesting.h"
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
    const std::vector<std::tuple<std::string, cv::Mat, cv::Mat>> files = {
        {"a_plain.png", Scene(1), Scene(1)},         {"b_grey.png", grey, greyBgr},
        {"c_deep.png", deep, Scene(3)},              {"d_alpha.png", withAlpha, Scene(4)},
        {"e_tiff.TIF", Scene(5), Scene(5)},          {"f_lossless.webp", Scene(6, 130, 90), Scene(6, 130, 90)}};
    std::vector<cv::Mat> asRead;
    for (const auto& [name, written, expected] : files) {
        EXPECT_TRUE(cv::imwrite((dir / name).string(), written, {cv::IMWRITE_WEBP_QUALITY, 101})) << name;
        asRead.push_back(expected);
    }
    std::ofstream(dir / "notes.txt") << "not a photo";  // ignored
    return asRead;
}

// The style set and its default model, built once for the tests that only read them.
struct Built {
    TempDir styles, model;
    std::vector<cv::Mat> asRead = WriteStyles(styles.path);
    std::vector<double> progress;
    Built() {
        BuildModel({styles.path.string(), "", model.path.string(), 0,
                    [this](double fraction, const std::string&) { progress.push_back(fraction); }});
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

ColourStats LibraryStats(const cv::Mat& bgr8) {
    cv::Mat lab(bgr8.rows, bgr8.cols, CV_32FC3);
    ConvertToLab(bgr8, lab);
    ColourStats stats{};
    ComputeChromaStats(lab, stats);
    ComputeLightnessStats(lab, stats);
    return stats;
}

}  // namespace

TEST(ModelBuilder, SameInputsGiveSameBytesInTheDocumentedLayouts) {
    const Built& built = Shared();
    const TempDir again;
    Build(built.styles.path, again.path);
    const std::map<std::string, std::string> files = Files(built.model.path);
    EXPECT_EQ(files.size(), 6u);  // no staging leftovers
    EXPECT_TRUE(files == Files(again.path));

    // Six photos, six content samples each; one cluster per ten samples.
    using Layout = std::tuple<const char*, std::vector<int32_t>, size_t>;  // file, header, size
    for (const auto& [file, header, size] : std::vector<Layout>{{kClusterFileName, {4}, 4 + 2048 * 4},
                                                                 {kStyleFileName, {6}, 4 + 152 * 6},
                                                                 {kScoresFileName, {4, 6}, 8 + 4 * 4 * 6},
                                                                 {kDistanceFileName, {6}, 4 + 4 * 21}}) {
        const std::string bytes = ReadBytes(built.model.path / file);
        EXPECT_EQ(bytes.size(), size) << file;
        for (size_t i = 0; i < header.size(); ++i) EXPECT_EQ(At<int32_t>(bytes, 4 * i), header[i]) << file;
    }
    ASSERT_FALSE(built.progress.empty());
    EXPECT_EQ(built.progress.back(), 1.0);
    EXPECT_TRUE(std::is_sorted(built.progress.begin(), built.progress.end()));
}

TEST(ModelBuilder, RecordsAndDistancesComeFromEachPhotosColours) {
    const Built& built = Shared();
    // Records in file-name order, 38 words each: the library's statistics of
    // the photo as read (grey expanded, 16-bit reduced, alpha dropped).
    const std::string records = ReadBytes(built.model.path / kStyleFileName);
    const size_t n = built.asRead.size();
    std::vector<ColourStats> stored(n);
    for (size_t s = 0; s < n; ++s) {
        const ColourStats expected = LibraryStats(built.asRead[s]);
        std::memcpy(stored[s].data(), records.data() + 4 + 152 * s, 152);
        for (int w = 0; w < 38; ++w) EXPECT_EQ(stored[s].data()[w], expected.data()[w]) << "style " << s << " word " << w;
    }
    // Upper triangle with diagonal, row by row.
    const std::string distances = ReadBytes(built.model.path / kDistanceFileName);
    size_t offset = 4;
    for (size_t i = 0; i < n; ++i)
        for (size_t j = i; j < n; ++j, offset += 4)
            EXPECT_EQ(At<float>(distances, offset), i == j ? 0.0f : float(StyleDistance(stored[i], stored[j])))
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
    for (const ColourStats* b : {&cast, &vivid, &brighter}) EXPECT_NEAR(std::sqrt(StyleDistance(a, *b)), 15.0, 1e-4);
    EXPECT_EQ(StyleDistance(a, a), 0.0);
    EXPECT_EQ(StyleDistance(a, cast), StyleDistance(cast, a));
}

TEST(ModelBuilder, NetworkLoadsAndEachStyleScoresBestInItsNearestCluster) {
    const Built& built = Shared();
    const fs::path net = built.model.path / kNetworkFolder;
    auto network = FeatureNetwork::Load((net / kNetworkDefinitionName).string(), (net / kNetworkWeightsName).string());
    ASSERT_TRUE(network->hasMemoryDataInput());
    std::string centres = ReadBytes(built.model.path / kClusterFileName);
    std::string scores = ReadBytes(built.model.path / kScoresFileName);
    const int clusters = At<int32_t>(centres, 0), styles = At<int32_t>(scores, 4);
    const cv::Mat centreRows(clusters, 512, CV_32F, &centres[4]), scoreRows(clusters, styles, CV_32F, &scores[8]);
    const std::vector<std::string> photos = ListPhotos(built.styles.path.string());
    ASSERT_EQ(int(photos.size()), styles);
    for (int s = 0; s < styles; ++s) {
        cv::Mat canvas, distances;
        ASSERT_TRUE(PrepareNetworkImage(ReadPhoto(photos[s]), canvas, kNetworkImageSize, kNetworkInputSize));
        const std::vector<float> feature = network->Forward(canvas);
        ASSERT_EQ(feature.size(), 512u);
        for (int k = 0; k < clusters; ++k) distances.push_back(cv::norm(centreRows.row(k), cv::Mat(feature).t()));
        cv::Point nearest, best;
        cv::minMaxLoc(distances, nullptr, nullptr, &nearest);
        cv::minMaxLoc(scoreRows.col(s), nullptr, nullptr, nullptr, &best);
        EXPECT_EQ(best.y, nearest.y) << photos[s];
    }
}

TEST(ModelBuilder, ContentFolderGivesTheClusterSamples) {
    const TempDir content, out;
    for (int i = 0; i < 5; ++i) cv::imwrite((content.path / ("c" + std::to_string(i) + ".jpg")).string(), Scene(20 + i));
    // Five content photos, taken as they are: one cluster by default, five at most.
    for (int clusters : {0, 5}) {
        Build(Shared().styles.path, out.path, clusters, content.path);
        EXPECT_EQ(At<int32_t>(ReadBytes(out.path / kClusterFileName), 0), std::max(clusters, 1));
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
             {good, underFile, 0, "cannot create the model folder " + underFile}}) {
        try {
            Build(styles, out, clusters);
            ADD_FAILURE() << "built despite: " << message;
        } catch (const std::runtime_error& e) {
            EXPECT_NE(std::string(e.what()).find(message), std::string::npos) << e.what();
        }
    }
    // The failed builds left the earlier model as it was, and nothing else.
    EXPECT_TRUE(Files(built.model.path) == before);
}
