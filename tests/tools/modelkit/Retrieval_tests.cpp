#include "modelkit/Retrieval.h"

#include <cstdio>

#include <opencv2/imgcodecs.hpp>

#include "KitTesting.h"
#include "modelkit/Photos.h"

using namespace vora::modelkit;
using namespace kit_testing;

// On the sample corpus (scripts/fetch-photos.sh), with the descriptor fitted
// on it as the sample model is, at least 90 % of the altered copies must find
// a copy of their own photo first.
TEST(Retrieval, SampleCorpusFindsAlteredCopies) {
    const fs::path styles = fs::path(VORA_SOURCE_DIR) / ".cache" / "photos" / "styles";
    if (!fs::is_directory(styles)) GTEST_SKIP() << "no sample photos; run scripts/fetch-photos.sh";
    const TempDir model;
    Build(styles, model.path);
    const RetrievalResult result = MeasureRetrieval(model.path.string(), ListPhotos(styles.string()));
    EXPECT_GE(result.photos, 100);
    EXPECT_EQ(result.queries, 5 * result.photos);
    std::printf("retrieval: %d of %d (%.1f %%)\n", result.found, result.queries, 100.0 * result.Rate());
    EXPECT_GE(result.Rate(), 0.9);
}

TEST(Retrieval, CountsQueriesAndMisses) {
    const TempDir photos, model;
    for (int i = 0; i < 4; ++i) cv::imwrite((photos.path / ("p" + std::to_string(i) + ".png")).string(), Scene(7 + i, 120, 160));
    Build(photos.path, model.path);
    const std::vector<std::string> paths = ListPhotos(photos.path.string());
    const RetrievalResult distinct = MeasureRetrieval(model.path.string(), paths);
    EXPECT_EQ(distinct.queries, 20);
    EXPECT_EQ(distinct.found, 20);
    // The same file twice: its copies match the twin as often as themselves.
    const RetrievalResult twins = MeasureRetrieval(model.path.string(), {paths[0], paths[0], paths[1]});
    EXPECT_EQ(twins.queries, 15);
    EXPECT_LT(twins.found, 15);
    EXPECT_EQ(twins.misses.size(), static_cast<size_t>(15 - twins.found));
}
