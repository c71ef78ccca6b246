#include "modelkit/Retrieval.h"

#include <unistd.h>

#include <cstdio>
#include <filesystem>

#include <gtest/gtest.h>
#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include "modelkit/ModelBuilder.h"
#include "modelkit/Photos.h"

namespace fs = std::filesystem;
using namespace vora::modelkit;

// On the sample corpus (scripts/fetch-photos.sh): altered copies of each
// photo must find a copy of the same photo first for at least 90 % of the
// queries, with the descriptor fitted on that corpus as the sample model is.
TEST(Retrieval, SampleCorpusFindsAlteredCopies) {
    const fs::path styles = fs::path(VORA_SOURCE_DIR) / ".cache" / "photos" / "styles";
    if (!fs::is_directory(styles)) GTEST_SKIP() << "no sample photos; run scripts/fetch-photos.sh";

    const fs::path model = fs::temp_directory_path() / ("vora_retrieval_" + std::to_string(::getpid()));
    BuildModelOptions options;
    options.stylesDir = styles.string();
    options.outDir = model.string();
    BuildModel(options);
    const RetrievalResult result = MeasureRetrieval(model.string(), ListPhotos(styles.string()));
    fs::remove_all(model);

    EXPECT_GE(result.photos, 100);
    EXPECT_EQ(result.queries, 5 * result.photos);
    std::printf("retrieval: %d of %d (%.1f %%)\n", result.found, result.queries, 100.0 * result.Rate());
    EXPECT_GE(result.Rate(), 0.9);
}

// The measurement itself: distinct scenes are told apart, and a corpus
// where two photos are the same picture cannot reach 100 %.
TEST(Retrieval, CountsQueriesAndMisses) {
    const fs::path dir = fs::temp_directory_path() / ("vora_retrieval_small_" + std::to_string(::getpid()));
    fs::remove_all(dir);
    fs::create_directories(dir / "photos");
    for (int i = 0; i < 4; ++i) {
        cv::Mat photo(120, 160, CV_8UC3);
        cv::RNG(i + 7).fill(photo, cv::RNG::UNIFORM, 0, 256);
        cv::blur(photo, photo, cv::Size(9, 9));
        photo += cv::Scalar(40 * i, 100 - 20 * i, 30);
        cv::imwrite((dir / "photos" / ("p" + std::to_string(i) + ".png")).string(), photo);
    }
    BuildModelOptions options;
    options.stylesDir = (dir / "photos").string();
    options.outDir = (dir / "model").string();
    BuildModel(options);
    const std::vector<std::string> photos = ListPhotos((dir / "photos").string());
    const RetrievalResult distinct = MeasureRetrieval(options.outDir, photos);
    EXPECT_EQ(distinct.queries, 20);
    EXPECT_EQ(distinct.found, 20);

    // The same file twice: its copies match the twin as often as themselves.
    const RetrievalResult twins = MeasureRetrieval(options.outDir, {photos[0], photos[0], photos[1]});
    EXPECT_EQ(twins.queries, 15);
    EXPECT_LT(twins.found, 15);
    EXPECT_EQ(twins.misses.size(), static_cast<size_t>(15 - twins.found));
    fs::remove_all(dir);
}
