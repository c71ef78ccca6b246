#include "modelkit/SubjectRetrieval.h"

#include <gtest/gtest.h>
#include <opencv2/imgcodecs.hpp>

#include "KitTesting.h"

using namespace vora::modelkit;
namespace fs = std::filesystem;

namespace {

// Seven photos on a line, worked out by hand: a at 0, 1, 2; b at 10, 11, 3;
// c alone at 30. Indices 0..6 in that order.
const std::vector<std::vector<float>> kLine = {{0}, {1}, {2}, {10}, {11}, {3}, {30}};
const std::vector<std::string> kSubjects = {"a", "a", "a", "b", "b", "b", "c"};

}  // namespace

TEST(SubjectRetrieval, NeighboursAndPrecisionOnAHandWorkedSet) {
    // Photo 2 (at 2) has photos 1 and 5 at distance 1: the lower index comes first.
    EXPECT_EQ(NearestNeighbours(kLine, 2, 3), (std::vector<int>{1, 5, 0}));
    EXPECT_EQ(NearestNeighbours(kLine, 6, 99).size(), 6u);

    EXPECT_EQ(PrecisionAtK(kLine, kSubjects, 1), (std::vector<double>{1, 1, 1, 1, 1, 0, 0}));
    EXPECT_EQ(PrecisionAtK(kLine, kSubjects, 2), (std::vector<double>{1, 1, 0.5, 1, 1, 0, 0}));
    // Five of six others: every a or b photo has the two others of its kind
    // among them; more than six neighbours cannot be asked for.
    const double twoFifths = 2.0 / 5.0, twoSixths = 2.0 / 6.0;
    EXPECT_EQ(PrecisionAtK(kLine, kSubjects, 5),
              (std::vector<double>{twoFifths, twoFifths, twoFifths, twoFifths, twoFifths, twoFifths, 0}));
    EXPECT_EQ(PrecisionAtK(kLine, kSubjects, 10),
              (std::vector<double>{twoSixths, twoSixths, twoSixths, twoSixths, twoSixths, twoSixths, 0}));

    const std::vector<SubjectPrecision> rows = MeasureSubjectPrecision(kLine, kSubjects);
    ASSERT_EQ(rows.size(), 4u);
    const std::vector<std::string> names = {"a", "b", "c", "all"};
    const std::vector<int> photos = {3, 3, 1, 7};
    const std::vector<double> atOne = {1.0, 2.0 / 3.0, 0.0, 5.0 / 7.0};
    const std::vector<double> atFive = {0.4, 0.4, 0.0, 2.4 / 7.0};
    for (size_t i = 0; i < rows.size(); ++i) {
        EXPECT_EQ(rows[i].subject, names[i]);
        EXPECT_EQ(rows[i].photos, photos[i]);
        EXPECT_NEAR(rows[i].atOne, atOne[i], 1e-12) << names[i];
        EXPECT_NEAR(rows[i].atFive, atFive[i], 1e-12) << names[i];
    }
    EXPECT_THROW(MeasureSubjectPrecision(kLine, {"a"}), std::invalid_argument);
}

TEST(SubjectRetrieval, LabHistogramBinsByEightBitLab) {
    // Black is L 0, a 128, b 128: bin (0, 4, 4); white has L 255: bin (7, 4, 4).
    cv::Mat photo(4, 6, CV_8UC3, cv::Scalar::all(0));
    photo(cv::Rect(0, 0, 6, 1)).setTo(cv::Scalar::all(255));
    const std::vector<float> histogram = LabHistogram(photo);
    ASSERT_EQ(histogram.size(), 512u);
    EXPECT_FLOAT_EQ(histogram[0 * 64 + 4 * 8 + 4], 0.75f);
    EXPECT_FLOAT_EQ(histogram[7 * 64 + 4 * 8 + 4], 0.25f);
    EXPECT_EQ(cv::countNonZero(cv::Mat(histogram)), 2);
}

TEST(SubjectRetrieval, SubFoldersNameTheSubjects) {
    kit_testing::TempDir dir;
    const cv::Mat pixel(2, 2, CV_8UC3, cv::Scalar::all(7));
    EXPECT_THROW(ListLabelledPhotos(dir.path.string()), std::runtime_error);
    for (const char* folder : {"water", "people", "empty"}) fs::create_directories(dir.path / folder);
    for (const char* file : {"water/b.png", "water/a.jpg", "people/z.png", "stray.png"})
        cv::imwrite((dir.path / file).string(), pixel);

    const std::vector<LabelledPhoto> photos = ListLabelledPhotos(dir.path.string());
    ASSERT_EQ(photos.size(), 3u);
    const std::vector<std::pair<std::string, std::string>> expected = {
        {"people", "z.png"}, {"water", "a.jpg"}, {"water", "b.png"}};
    for (size_t i = 0; i < photos.size(); ++i) {
        EXPECT_EQ(photos[i].subject, expected[i].first);
        EXPECT_EQ(fs::path(photos[i].path).filename(), expected[i].second);
    }
}
