#include "modelkit/ModelBuilder.h"

#include <unistd.h>

#include <cmath>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>

#include <gtest/gtest.h>
#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include "model/FeatureNetwork.h"
#include "model/StyleDatabase.h"
#include "modelkit/Photos.h"
#include "modelkit/StyleDistance.h"
#include "semantic/NetworkInput.h"
#include "transfer/ColourStatistics.h"

namespace fs = std::filesystem;
using namespace vora;
using namespace vora::modelkit;

namespace {

struct TempDir {
    fs::path path;
    explicit TempDir(const std::string& tag) {
        path = fs::temp_directory_path() / ("vora_builder_" + std::to_string(::getpid()) + "_" + tag + "_" +
                                            ::testing::UnitTest::GetInstance()->current_test_info()->name());
        fs::remove_all(path);
        fs::create_directories(path);
    }
    ~TempDir() { fs::remove_all(path); }
};

std::string ReadBytes(const fs::path& path) {
    std::ifstream file(path, std::ios::binary);
    std::ostringstream out;
    out << file.rdbuf();
    return out.str();
}

int32_t IntAt(const std::string& bytes, size_t offset) {
    int32_t v;
    std::memcpy(&v, bytes.data() + offset, 4);
    return v;
}

float FloatAt(const std::string& bytes, size_t offset) {
    float v;
    std::memcpy(&v, bytes.data() + offset, 4);
    return v;
}

// A scene: a colour gradient under blurred noise, different for each seed.
cv::Mat Scene(int seed, int rows = 96, int cols = 128) {
    cv::Mat image(rows, cols, CV_8UC3);
    cv::RNG rng(seed);
    const cv::Vec3d from(rng.uniform(0, 256), rng.uniform(0, 256), rng.uniform(0, 256));
    const cv::Vec3d to(rng.uniform(0, 256), rng.uniform(0, 256), rng.uniform(0, 256));
    cv::Mat noise(rows, cols, CV_8UC3);
    rng.fill(noise, cv::RNG::UNIFORM, 0, 256);
    cv::GaussianBlur(noise, noise, cv::Size(0, 0), 1.0 + seed % 4);
    for (int y = 0; y < rows; ++y)
        for (int x = 0; x < cols; ++x) {
            const double t = (seed % 2 ? x : y) / double(seed % 2 ? cols : rows);
            for (int c = 0; c < 3; ++c)
                image.at<cv::Vec3b>(y, x)[c] = cv::saturate_cast<uchar>(
                    (1 - t) * from[c] + t * to[c] + 0.5 * (noise.at<cv::Vec3b>(y, x)[c] - 128.0));
        }
    return image;
}

ColourStats LibraryStats(const cv::Mat& bgr8) {
    cv::Mat lab;
    lab.create(bgr8.rows, bgr8.cols, CV_32FC3);
    ConvertToLab(bgr8, lab);
    ColourStats stats{};
    ComputeChromaStats(lab, stats);
    ComputeLightnessStats(lab, stats);
    return stats;
}

// Style photos in several formats. Names sort as listed; the expected BGR
// image of each (what the statistics must be computed on) is kept.
struct StyleSet {
    std::vector<cv::Mat> expected;

    explicit StyleSet(const fs::path& dir) {
        cv::Mat a = Scene(1);
        cv::imwrite((dir / "a_plain.png").string(), a);
        expected.push_back(a);

        cv::Mat grey;
        cv::cvtColor(Scene(2), grey, cv::COLOR_BGR2GRAY);
        cv::imwrite((dir / "b_grey.png").string(), grey);
        cv::Mat greyBgr;
        cv::merge(std::vector<cv::Mat>{grey, grey, grey}, greyBgr);
        expected.push_back(greyBgr);

        // 16-bit samples reduce to the nearest 8-bit value: v16 = 257 v8 + 100.
        cv::Mat c = Scene(3);
        cv::Mat c16;
        c.convertTo(c16, CV_16U, 257.0, 100.0);
        cv::imwrite((dir / "c_deep.png").string(), c16);
        expected.push_back(c);

        // An alpha channel plays no part.
        cv::Mat d = Scene(4);
        cv::Mat alpha(d.size(), CV_8U);
        cv::randu(alpha, 0, 256);
        cv::Mat bgra;
        std::vector<cv::Mat> planes;
        cv::split(d, planes);
        planes.push_back(alpha);
        cv::merge(planes, bgra);
        cv::imwrite((dir / "d_alpha.png").string(), bgra);
        expected.push_back(d);

        cv::Mat e = Scene(5);
        cv::imwrite((dir / "e_tiff.TIF").string(), e);
        expected.push_back(e);

        cv::Mat f = Scene(6, 130, 90);
        cv::imwrite((dir / "f_lossless.webp").string(), f, {cv::IMWRITE_WEBP_QUALITY, 101});
        expected.push_back(cv::imread((dir / "f_lossless.webp").string(), cv::IMREAD_COLOR));

        // Not a photo: ignored.
        std::ofstream((dir / "notes.txt").string()) << "not a photo";
    }
};

const std::vector<std::string>& ModelFiles() {
    static const std::vector<std::string> files{
        kClusterFileName, kStyleFileName, kScoresFileName, kDistanceFileName,
        std::string(kNetworkFolder) + kNetworkDefinitionName, std::string(kNetworkFolder) + kNetworkWeightsName};
    return files;
}

void Build(const fs::path& styles, const fs::path& out, int clusters = 0, const fs::path& content = {}) {
    BuildModelOptions options;
    options.stylesDir = styles.string();
    options.contentDir = content.string();
    options.outDir = out.string();
    options.clusters = clusters;
    BuildModel(options);
}

std::string BuildError(const BuildModelOptions& options) {
    try {
        BuildModel(options);
    } catch (const std::runtime_error& e) {
        return e.what();
    }
    return "no error";
}

}  // namespace

TEST(ModelBuilder, SameInputsGiveSameBytesInTheDocumentedLayouts) {
    TempDir styles("styles"), first("first"), second("second");
    const StyleSet set(styles.path);
    std::vector<double> fractions;
    BuildModelOptions options;
    options.stylesDir = styles.path.string();
    options.outDir = first.path.string();
    options.progress = [&](double fraction, const std::string&) { fractions.push_back(fraction); };
    BuildModel(options);
    Build(styles.path, second.path);

    for (const std::string& name : ModelFiles()) {
        const std::string a = ReadBytes(first.path / name);
        ASSERT_FALSE(a.empty()) << name;
        EXPECT_EQ(a, ReadBytes(second.path / name)) << name;
    }
    // Nothing else is left in the model folder (no staging leftovers).
    int entries = 0;
    for (const auto& entry : fs::recursive_directory_iterator(first.path)) entries += entry.is_regular_file();
    EXPECT_EQ(entries, 6);

    // Six photos, six content samples each; one cluster per ten samples.
    const int styleCount = 6, clusters = 4;
    const std::string centres = ReadBytes(first.path / kClusterFileName);
    EXPECT_EQ(IntAt(centres, 0), clusters);
    EXPECT_EQ(centres.size(), 4u + 2048u * clusters);
    const std::string records = ReadBytes(first.path / kStyleFileName);
    EXPECT_EQ(IntAt(records, 0), styleCount);
    EXPECT_EQ(records.size(), 4u + 152u * styleCount);
    const std::string scores = ReadBytes(first.path / kScoresFileName);
    EXPECT_EQ(IntAt(scores, 0), clusters);
    EXPECT_EQ(IntAt(scores, 4), styleCount);
    EXPECT_EQ(scores.size(), 8u + 4u * clusters * styleCount);
    const std::string distances = ReadBytes(first.path / kDistanceFileName);
    EXPECT_EQ(IntAt(distances, 0), styleCount);
    EXPECT_EQ(distances.size(), 4u + 4u * styleCount * (styleCount + 1) / 2);

    ASSERT_FALSE(fractions.empty());
    EXPECT_EQ(fractions.back(), 1.0);
    for (size_t i = 1; i < fractions.size(); ++i) EXPECT_GE(fractions[i], fractions[i - 1]);
}

TEST(ModelBuilder, RecordsAndDistancesComeFromEachPhotosColours) {
    TempDir styles("styles"), out("out");
    const StyleSet set(styles.path);
    Build(styles.path, out.path);

    // Records in file-name order, 38 words each: the library's statistics of
    // the photo as read (grey expanded, 16-bit reduced, alpha dropped).
    const std::string records = ReadBytes(out.path / kStyleFileName);
    std::vector<ColourStats> stored(set.expected.size());
    for (size_t s = 0; s < set.expected.size(); ++s) {
        const ColourStats expected = LibraryStats(set.expected[s]);
        stored[s] = ColourStats{};
        std::memcpy(stored[s].data(), records.data() + 4 + 152 * s, 152);
        for (int w = 0; w < 38; ++w) EXPECT_EQ(stored[s].data()[w], expected.data()[w]) << "style " << s << " word " << w;
    }

    // Upper triangle with diagonal, row by row.
    const std::string distances = ReadBytes(out.path / kDistanceFileName);
    const int n = static_cast<int>(stored.size());
    size_t offset = 4;
    for (int i = 0; i < n; ++i)
        for (int j = i; j < n; ++j, offset += 4) {
            const float expected = i == j ? 0.0f : static_cast<float>(StyleDistance(stored[i], stored[j]));
            EXPECT_EQ(FloatAt(distances, offset), expected) << i << "," << j;
        }
    // The grey photo has no colour: it lies far from the others.
    EXPECT_GT(std::sqrt(FloatAt(distances, 4 + 4 * 1)), 15.0f);
}

TEST(ModelBuilder, StyleDistanceReadsInLabUnits) {
    ColourStats a{};
    for (int i = 0; i < 32; ++i) a.lightness[i] = i / 31.0f;
    a.chromaSqrtCov[0] = a.chromaSqrtCov[3] = 10.0f;

    ColourStats cast = a;  // a colour cast of 15 units: 9 in a*, 12 in b*
    cast.chromaMean[0] += 9.0f;
    cast.chromaMean[1] += 12.0f;
    EXPECT_NEAR(std::sqrt(StyleDistance(a, cast)), 15.0, 1e-5);

    ColourStats vivid = a;  // chroma spread up by 15 in every direction
    vivid.chromaSqrtCov[0] = vivid.chromaSqrtCov[3] = 25.0f;
    EXPECT_NEAR(std::sqrt(StyleDistance(a, vivid)), 15.0, 1e-5);

    ColourStats brighter = a;  // every tone 15 L* higher
    for (float& l : brighter.lightness) l += 0.15f;
    EXPECT_NEAR(std::sqrt(StyleDistance(a, brighter)), 15.0, 1e-4);

    EXPECT_EQ(StyleDistance(a, a), 0.0);
    EXPECT_EQ(StyleDistance(a, cast), StyleDistance(cast, a));
}

TEST(ModelBuilder, NetworkLoadsAndEachStyleScoresBestInItsNearestCluster) {
    TempDir styles("styles"), out("out");
    const StyleSet set(styles.path);
    Build(styles.path, out.path, 3);

    const fs::path net = out.path / kNetworkFolder;
    auto network = FeatureNetwork::Load((net / kNetworkDefinitionName).string(), (net / kNetworkWeightsName).string());
    ASSERT_TRUE(network->hasMemoryDataInput());

    const std::string centres = ReadBytes(out.path / kClusterFileName);
    const std::string scores = ReadBytes(out.path / kScoresFileName);
    const int clusters = IntAt(centres, 0);
    const int styleCount = IntAt(scores, 4);
    ASSERT_EQ(clusters, 3);
    const std::vector<std::string> photos = ListPhotos(styles.path.string());
    ASSERT_EQ(static_cast<int>(photos.size()), styleCount);
    for (int s = 0; s < styleCount; ++s) {
        cv::Mat canvas;
        ASSERT_TRUE(PrepareNetworkImage(ReadPhoto(photos[s]), canvas, kNetworkImageSize, kNetworkInputSize));
        const std::vector<float> feature = network->Forward(canvas);
        ASSERT_EQ(feature.size(), 512u);
        int nearest = 0, best = 0;
        double nearestDistance = 1e300;
        for (int k = 0; k < clusters; ++k) {
            double d = 0.0;
            for (int i = 0; i < 512; ++i) d += std::pow(feature[i] - FloatAt(centres, 4 + 2048 * k + 4 * i), 2);
            if (d < nearestDistance) nearestDistance = d, nearest = k;
            if (FloatAt(scores, 8 + 4 * (k * styleCount + s)) > FloatAt(scores, 8 + 4 * (best * styleCount + s))) best = k;
        }
        EXPECT_EQ(best, nearest) << photos[s];
    }
}

TEST(ModelBuilder, ContentFolderGivesTheClusterSamples) {
    TempDir styles("styles"), content("content"), out("out");
    const StyleSet set(styles.path);
    for (int i = 0; i < 5; ++i) cv::imwrite((content.path / ("c" + std::to_string(i) + ".jpg")).string(), Scene(20 + i));
    Build(styles.path, out.path, 0, content.path);
    // Five content photos, taken as they are: one cluster by default.
    EXPECT_EQ(IntAt(ReadBytes(out.path / kClusterFileName), 0), 1);
    Build(styles.path, out.path, 5, content.path);
    EXPECT_EQ(IntAt(ReadBytes(out.path / kClusterFileName), 0), 5);
}

TEST(ModelBuilder, FailuresSayWhatIsWrongAndLeaveTheModelAlone) {
    TempDir styles("styles"), out("out"), empty("empty");
    const StyleSet set(styles.path);
    Build(styles.path, out.path);
    std::vector<std::string> before;
    for (const std::string& name : ModelFiles()) before.push_back(ReadBytes(out.path / name));

    BuildModelOptions options;
    options.outDir = out.path.string();

    options.stylesDir = empty.path.string();
    EXPECT_NE(BuildError(options).find("need at least 2 style photos in " + empty.path.string() + ", found 0"),
              std::string::npos);

    options.stylesDir = (empty.path / "missing").string();
    EXPECT_NE(BuildError(options).find("is not a readable folder"), std::string::npos);

    options.stylesDir = styles.path.string();
    options.clusters = 1000;
    EXPECT_NE(BuildError(options).find("cannot make 1000 clusters from 36 content samples"), std::string::npos);
    options.clusters = 0;

    std::ofstream((styles.path / "zz_broken.jpg").string()) << "these bytes are no JPEG";
    EXPECT_EQ(BuildError(options), "cannot read the photo " + (styles.path / "zz_broken.jpg").string());

    // The failed builds left the earlier model as it was, and nothing else.
    for (size_t i = 0; i < before.size(); ++i) EXPECT_EQ(ReadBytes(out.path / ModelFiles()[i]), before[i]);
    int entries = 0;
    for (const auto& entry : fs::recursive_directory_iterator(out.path)) entries += entry.is_regular_file();
    EXPECT_EQ(entries, 6);

    fs::remove(styles.path / "zz_broken.jpg");
    options.outDir = (out.path / kClusterFileName / "model").string();  // under a regular file
    EXPECT_EQ(BuildError(options), "cannot create the model folder " + options.outDir);
}
