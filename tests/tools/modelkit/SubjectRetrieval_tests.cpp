#include "modelkit/SubjectRetrieval.h"

#include <sstream>

#include <gtest/gtest.h>

using namespace vora::modelkit;

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
    const auto sixThenZero = [](double v) { std::vector<double> p(6, v); p.push_back(0); return p; };
    EXPECT_EQ(PrecisionAtK(kLine, kSubjects, 5), sixThenZero(2.0 / 5.0));
    EXPECT_EQ(PrecisionAtK(kLine, kSubjects, 10), sixThenZero(2.0 / 6.0));

    // Per subject, then over all photos: name, photos, precision at 1 and at 5.
    std::ostringstream rows;
    for (const SubjectPrecision& row : MeasureSubjectPrecision(kLine, kSubjects))
        rows << row.subject << " " << row.photos << " " << row.atOne * 21 << " " << row.atFive * 35 << "; ";
    EXPECT_EQ(rows.str(), "a 3 21 14; b 3 14 14; c 1 0 0; all 7 15 12; ");  // scaled to whole numbers
    EXPECT_THROW(MeasureSubjectPrecision(kLine, {"a"}), std::invalid_argument);
}
