#include "modelkit/Retrieval.h"

#include <cstdio>


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
