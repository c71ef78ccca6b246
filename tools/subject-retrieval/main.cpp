// vora-subject-retrieval: how well a feature groups photos by subject (see
// modelkit/SubjectRetrieval.h).
//   vora-subject-retrieval EVAL_DIR [--model DIR]... [--lab] [--neighbours FILE]
// EVAL_DIR holds one folder of photos per subject (scripts/fetch-photos.sh
// lays out .cache/photos/eval/ so). Each --model measures that model's
// network as the library runs it; --lab measures a Lab colour histogram.
// --neighbours lists, for the photo with that file name, its five nearest
// photos under each feature.

#include <chrono>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "model/FeatureNetwork.h"
#include "modelkit/Photos.h"
#include "modelkit/Retrieval.h"
#include "modelkit/SubjectRetrieval.h"

namespace fs = std::filesystem;
using namespace vora::modelkit;

namespace {

constexpr const char* kUsage =
    "usage: vora-subject-retrieval EVAL_DIR [--model DIR]... [--lab] [--neighbours FILE]\n"
    "  EVAL_DIR   one folder of photos per subject (e.g. .cache/photos/eval)\n"
    "  --model    a model directory whose network is measured (repeatable)\n"
    "  --lab      measure a 512-bin Lab colour histogram as well\n";

void Report(const std::string& name, const std::vector<LabelledPhoto>& photos,
            const std::vector<std::vector<float>>& features, const std::string& neighboursOf, double seconds) {
    std::vector<std::string> subjects;
    for (const LabelledPhoto& photo : photos) subjects.push_back(photo.subject);
    const std::vector<SubjectPrecision> rows = MeasureSubjectPrecision(features, subjects);
    std::printf("%s: %zu photos in %zu subjects (features in %.1f s)\n", name.c_str(), photos.size(),
                rows.size() - 1, seconds);
    std::printf("  %-12s %6s %6s %6s\n", "subject", "photos", "P@1", "P@5");
    for (const SubjectPrecision& row : rows)
        std::printf("  %-12s %6d %6.2f %6.2f\n", row.subject.c_str(), row.photos, row.atOne, row.atFive);
    for (size_t q = 0; q < photos.size(); ++q) {
        if (neighboursOf.empty() || fs::path(photos[q].path).filename() != neighboursOf) continue;
        std::printf("  nearest to %s (%s):", neighboursOf.c_str(), photos[q].subject.c_str());
        for (int i : NearestNeighbours(features, static_cast<int>(q), 5))
            std::printf(" %s (%s)", fs::path(photos[i].path).filename().string().c_str(), photos[i].subject.c_str());
        std::printf("\n");
    }
}

}  // namespace

int main(int argc, char** argv) {
    std::string evalDir, neighboursOf;
    std::vector<std::string> modelDirs;
    bool lab = false;
    for (int i = 1; i < argc; ++i) {
        const std::string arg = argv[i];
        if (arg == "--model" && i + 1 < argc) {
            modelDirs.push_back(argv[++i]);
        } else if (arg == "--neighbours" && i + 1 < argc) {
            neighboursOf = argv[++i];
        } else if (arg == "--lab") {
            lab = true;
        } else if (!arg.empty() && arg[0] != '-' && evalDir.empty()) {
            evalDir = arg;
        } else {
            std::fprintf(stderr, "%s", kUsage);
            return 2;
        }
    }
    if (evalDir.empty() || (modelDirs.empty() && !lab)) {
        std::fprintf(stderr, "%s", kUsage);
        return 2;
    }

    try {
        using Clock = std::chrono::steady_clock;
        const std::vector<LabelledPhoto> photos = ListLabelledPhotos(evalDir);
        if (!neighboursOf.empty()) {
            bool known = false;
            for (const LabelledPhoto& photo : photos) known = known || fs::path(photo.path).filename() == neighboursOf;
            if (!known) throw std::runtime_error("no photo named " + neighboursOf + " in " + evalDir);
        }
        std::vector<cv::Mat> images;
        for (const LabelledPhoto& photo : photos) images.push_back(ReadPhotoBgr(photo.path));

        for (const std::string& modelDir : modelDirs) {
            const auto start = Clock::now();
            const std::unique_ptr<vora::FeatureNetwork> network = LoadModelNetwork(modelDir);
            std::vector<std::vector<float>> features;
            for (const cv::Mat& image : images) features.push_back(PhotoFeature(*network, image));
            Report("network of " + modelDir, photos, features, neighboursOf,
                   std::chrono::duration<double>(Clock::now() - start).count());
        }
        if (lab) {
            const auto start = Clock::now();
            std::vector<std::vector<float>> features;
            for (const cv::Mat& image : images) features.push_back(LabHistogram(image));
            Report("Lab histogram, 8 x 8 x 8 bins", photos, features, neighboursOf,
                   std::chrono::duration<double>(Clock::now() - start).count());
        }
    } catch (const std::exception& e) {
        std::fprintf(stderr, "vora-subject-retrieval: %s\n", e.what());
        return 1;
    }
    return 0;
}
