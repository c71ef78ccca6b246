#include "modelkit/ModelBuilder.h"

#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include <opencv2/core.hpp>

#include "model/FeatureNetwork.h"
#include "model/ModelFileNames.h"
#include "model/StyleDatabase.h"
#include "modelkit/Photos.h"
#include "modelkit/SceneDescriptor.h"
#include "modelkit/StyleDistance.h"
#include "semantic/NetworkInput.h"
#include "transfer/ColourStatistics.h"

namespace fs = std::filesystem;

namespace vora {
namespace modelkit {

namespace {

// Stored words of a style record: means, square-root covariance, lightness
// samples; the two percentile points are not part of the file.
constexpr int kStoredStyleWords = 38;

// Default cluster count: one cluster for every ten content samples (a photo
// and its five altered copies make six), at least one, at most 1000.
constexpr int kSamplesPerCluster = 10;
constexpr int kMaxDefaultClusters = 1000;

// k-means: a fixed seed, so the same photos give the same clusters.
constexpr uint64_t kClusterSeed = 0x766f7261;  // "vora"
constexpr int kClusterAttempts = 3;

void Report(const BuildModelOptions& options, double fraction, const std::string& what) {
    if (options.progress) options.progress(fraction, what);
}

// A staging folder inside the model folder: the files are written there and
// renamed into place only once all of them are complete, so a failed build
// leaves the previous model (or nothing) behind, never a mixture.
class Staging {
public:
    explicit Staging(const fs::path& outDir) : m_outDir(outDir) {
        std::error_code error;
        fs::create_directories(outDir, error);
        if (error || !fs::is_directory(outDir))
            throw std::runtime_error("cannot create the model folder " + outDir.string());
        m_path = outDir / (".vora-build-" + std::to_string(::getpid()));
        fs::remove_all(m_path, error);
        fs::create_directories(m_path / kNetworkFolder, error);
        fs::create_directories(m_path / "pooled", error);
        if (error) throw std::runtime_error("cannot write in the model folder " + outDir.string());
    }
    ~Staging() {
        std::error_code error;
        fs::remove_all(m_path, error);
    }
    Staging(const Staging&) = delete;
    Staging& operator=(const Staging&) = delete;

    const fs::path& path() const { return m_path; }

    void Publish(const std::vector<std::string>& relativeNames) {
        std::error_code error;
        fs::create_directories(m_outDir / kNetworkFolder, error);
        if (error) throw std::runtime_error("cannot create " + (m_outDir / kNetworkFolder).string());
        for (const std::string& name : relativeNames) {
            fs::rename(m_path / name, m_outDir / name, error);
            if (error) throw std::runtime_error("cannot write " + (m_outDir / name).string() + ": " + error.message());
        }
    }

private:
    fs::path m_outDir;
    fs::path m_path;
};

class BinaryFile {
public:
    explicit BinaryFile(fs::path path) : m_path(std::move(path)), m_file(m_path, std::ios::binary | std::ios::trunc) {
        if (!m_file) throw std::runtime_error("cannot write " + m_path.string());
    }
    // The files are little-endian, as this machine is.
    void Int(int32_t value) { Bytes(&value, sizeof value); }
    void Floats(const float* values, size_t count) { Bytes(values, count * sizeof(float)); }
    void Close() {
        m_file.close();
        if (!m_file) throw std::runtime_error("cannot write " + m_path.string());
    }

private:
    void Bytes(const void* data, size_t size) { m_file.write(static_cast<const char*>(data), static_cast<std::streamsize>(size)); }
    fs::path m_path;
    std::ofstream m_file;
};

ColourStats StyleStats(const cv::Mat& bgr8) {
    ColourStats stats{};
    SummariseColours(bgr8, ChannelOrder::Bgr, stats);
    return stats;
}

// The network's output for one image, its input prepared exactly as the
// library prepares it.
cv::Mat PooledRow(FeatureNetwork& network, const cv::Mat& bgr8, int size) {
    cv::Mat canvas;
    PrepareNetworkImage(bgr8, canvas, kNetworkImageSize, kNetworkInputSize);
    const std::vector<float> pooled = network.Forward(canvas);
    if (pooled.size() != static_cast<size_t>(size))
        throw std::runtime_error("the feature network gave " + std::to_string(pooled.size()) + " values instead of " +
                                 std::to_string(size));
    return cv::Mat(pooled, true).reshape(1, 1);
}

double EuclideanDistance(const float* a, const float* b, int size) {
    double sum = 0.0;
    for (int i = 0; i < size; ++i) sum += (double(a[i]) - b[i]) * (double(a[i]) - b[i]);
    return std::sqrt(sum);
}

// Score of style s for cluster k: how much nearer the cluster centre is to
// the style photo's own descriptor than the average centre is,
//   score = mean_j |c_j - f_s| - |c_k - f_s|,
// so styles taken from scenes like the cluster's rank first. Subtracting the
// plain distance alone would let a few styles that sit near the middle of
// the descriptor space ("hubs") head every cluster's ranking.
std::vector<float> ClusterStyleScores(const cv::Mat& centres, const cv::Mat& styleFeatures) {
    const int clusters = centres.rows;
    const int styles = styleFeatures.rows;
    std::vector<double> distance(static_cast<size_t>(clusters) * styles);
    std::vector<double> mean(styles, 0.0);
    for (int k = 0; k < clusters; ++k) {
        for (int s = 0; s < styles; ++s) {
            const double d = EuclideanDistance(centres.ptr<float>(k), styleFeatures.ptr<float>(s), centres.cols);
            distance[static_cast<size_t>(k) * styles + s] = d;
            mean[s] += d / clusters;
        }
    }
    std::vector<float> scores(distance.size());
    for (int k = 0; k < clusters; ++k)
        for (int s = 0; s < styles; ++s) {
            const size_t i = static_cast<size_t>(k) * styles + s;
            scores[i] = static_cast<float>(mean[s] - distance[i]);
        }
    return scores;
}

// The photos a build reads and how many clusters it makes, checked before
// anything is written.
struct BuildPlan {
    std::vector<std::string> stylePaths;
    std::vector<std::string> contentPaths;
    int samples = 0;  // content samples to cluster
    int clusters = 0;
};

BuildPlan PlanBuild(const BuildModelOptions& options) {
    if (options.stylesDir.empty()) throw std::runtime_error("no style photo folder given");
    if (options.outDir.empty()) throw std::runtime_error("no model folder given");
    if (options.clusters < 0) throw std::runtime_error("the number of clusters cannot be negative");

    Report(options, 0.0, "listing photos");
    BuildPlan plan;
    plan.stylePaths = ListPhotos(options.stylesDir);
    if (plan.stylePaths.size() < 2)
        throw std::runtime_error("need at least 2 style photos in " + options.stylesDir + ", found " +
                                 std::to_string(plan.stylePaths.size()) +
                                 " (the library offers only the better half of the styles)");
    if (!options.contentDir.empty()) {
        plan.contentPaths = ListPhotos(options.contentDir);
        if (plan.contentPaths.empty()) throw std::runtime_error("no photos in " + options.contentDir);
    }
    // Each style photo gives itself and its altered copies, unless content
    // photos are given.
    plan.samples = plan.contentPaths.empty()
                       ? static_cast<int>(plan.stylePaths.size() * (1 + AllAlterations().size()))
                       : static_cast<int>(plan.contentPaths.size());
    plan.clusters = options.clusters;
    if (plan.clusters == 0) {
        plan.clusters = std::min({kMaxDefaultClusters, plan.samples,
                                  std::max(1, static_cast<int>(std::lround(double(plan.samples) / kSamplesPerCluster)))});
    } else if (plan.clusters > plan.samples) {
        throw std::runtime_error("cannot make " + std::to_string(plan.clusters) + " clusters from " +
                                 std::to_string(plan.samples) + " content samples; ask for at most " +
                                 std::to_string(plan.samples));
    }
    return plan;
}

// What the photos give: the style records, each style's own feature row and
// the content samples' rows (pooled values, or the given network's feature).
struct PhotoFeatures {
    std::vector<ColourStats> styles;
    cv::Mat stylePooled;
    cv::Mat contentPooled;
};

PhotoFeatures ReadPhotos(const BuildModelOptions& options, const BuildPlan& plan, FeatureNetwork& net,
                         int pooledSize) {
    const size_t styleCount = plan.stylePaths.size();
    const double photoCount = static_cast<double>(styleCount + plan.contentPaths.size());
    PhotoFeatures features{std::vector<ColourStats>(styleCount), cv::Mat(0, pooledSize, CV_32F),
                           cv::Mat(0, pooledSize, CV_32F)};
    for (size_t s = 0; s < styleCount; ++s) {
        Report(options, 0.8 * s / photoCount, "reading " + fs::path(plan.stylePaths[s]).filename().string());
        const cv::Mat photo = ReadPhotoBgr(plan.stylePaths[s]);
        features.styles[s] = StyleStats(photo);
        features.stylePooled.push_back(PooledRow(net, photo, pooledSize));
        if (plan.contentPaths.empty()) {
            features.contentPooled.push_back(features.stylePooled.row(static_cast<int>(s)));
            for (Alteration alteration : AllAlterations())
                features.contentPooled.push_back(PooledRow(net, Alter(photo, alteration), pooledSize));
        }
    }
    for (size_t c = 0; c < plan.contentPaths.size(); ++c) {
        Report(options, 0.8 * (styleCount + c) / photoCount,
               "reading " + fs::path(plan.contentPaths[c]).filename().string());
        features.contentPooled.push_back(PooledRow(net, ReadPhotoBgr(plan.contentPaths[c]), pooledSize));
    }
    return features;
}

// The rows through the descriptor's final map.
cv::Mat Describe(const Projection& projection, const cv::Mat& pooled) {
    cv::Mat out(pooled.rows, kDescriptorSize, CV_32F);
    for (int r = 0; r < pooled.rows; ++r) {
        const std::vector<float> row = Project(projection, pooled.ptr<float>(r));
        std::memcpy(out.ptr<float>(r), row.data(), row.size() * sizeof(float));
    }
    return out;
}

// Semantic clusters of the content samples: their centres, one per row. The
// seed is fixed, so a build is reproducible, and OpenCV's own generator is
// left as it was.
cv::Mat ClusterCentres(const cv::Mat& contentFeatures, int clusters) {
    cv::Mat labels, centres;
    cv::RNG& rng = cv::theRNG();
    const uint64 saved = rng.state;
    rng.state = kClusterSeed;
    cv::kmeans(contentFeatures, clusters, labels,
               cv::TermCriteria(cv::TermCriteria::COUNT + cv::TermCriteria::EPS, 100, 1e-4), kClusterAttempts,
               cv::KMEANS_PP_CENTERS, centres);
    rng.state = saved;
    return centres;
}

// The four data files, into the staging folder.
void WriteDataFiles(const fs::path& stage, const cv::Mat& centres, const std::vector<ColourStats>& styles,
                    const cv::Mat& styleFeatures) {
    const int clusters = centres.rows;
    const int styleCount = static_cast<int>(styles.size());
    {
        BinaryFile file(stage / kClusterFileName);
        file.Int(clusters);
        for (int k = 0; k < clusters; ++k) file.Floats(centres.ptr<float>(k), kDescriptorSize);
        file.Close();
    }
    {
        BinaryFile file(stage / kStyleFileName);
        file.Int(styleCount);
        for (const ColourStats& style : styles) file.Floats(style.data(), kStoredStyleWords);
        file.Close();
    }
    {
        BinaryFile file(stage / kScoresFileName);
        file.Int(clusters);
        file.Int(styleCount);
        const std::vector<float> scores = ClusterStyleScores(centres, styleFeatures);
        file.Floats(scores.data(), scores.size());
        file.Close();
    }
    {
        BinaryFile file(stage / kDistanceFileName);
        file.Int(styleCount);
        std::vector<float> row;
        for (int i = 0; i < styleCount; ++i) {
            row.clear();
            for (int j = i; j < styleCount; ++j) row.push_back(static_cast<float>(StyleDistance(styles[i], styles[j])));
            file.Floats(row.data(), row.size());
        }
        file.Close();
    }
}

}  // namespace

void BuildModel(const BuildModelOptions& options) {
    const BuildPlan plan = PlanBuild(options);
    Staging staging(options.outDir);

    // A given network is the model's own and its output the feature; the
    // scene descriptor's pooled values are mapped by a fit made below.
    const bool fixedNetwork = options.network != nullptr;
    const fs::path pooledDir = staging.path() / (fixedNetwork ? kNetworkFolder : "pooled");
    WriteNetworkFiles(fixedNetwork ? *options.network : PooledFeatureNetwork(), pooledDir.string());
    PhotoFeatures features;
    {
        const std::unique_ptr<FeatureNetwork> pooledNet = FeatureNetwork::Load(
            (pooledDir / kNetworkDefinitionName).string(), (pooledDir / kNetworkWeightsName).string());
        features = ReadPhotos(options, plan, *pooledNet, fixedNetwork ? kDescriptorSize : PooledFeatureSize());
    }

    // The final map of the descriptor, fitted on every photo seen.
    Projection projection;
    cv::Mat styleFeatures = features.stylePooled, contentFeatures = features.contentPooled;
    if (!fixedNetwork) {
        Report(options, 0.8, "fitting the scene descriptor");
        cv::Mat fitRows = features.contentPooled.clone();
        if (!plan.contentPaths.empty()) fitRows.push_back(features.stylePooled);
        projection = FitProjection(fitRows);
        styleFeatures = Describe(projection, features.stylePooled);
        contentFeatures = Describe(projection, features.contentPooled);
    }

    Report(options, 0.85,
           "clustering " + std::to_string(plan.samples) + " samples into " + std::to_string(plan.clusters));
    const cv::Mat centres = ClusterCentres(contentFeatures, plan.clusters);

    Report(options, 0.95, "writing the model");
    WriteDataFiles(staging.path(), centres, features.styles, styleFeatures);
    if (!fixedNetwork) WriteNetworkFiles(DescriptorNetwork(projection), (staging.path() / kNetworkFolder).string());
    staging.Publish({std::begin(kModelFileNames), std::end(kModelFileNames)});
    Report(options, 1.0, "done");
}

}  // namespace modelkit
}  // namespace vora
