#pragma once

// How well a feature groups photos by subject. Every photo of a labelled set
// is a query against all the others (leave one out); its k nearest
// neighbours are ranked by the distance the library orders clusters by, and
// precision at k is the share of them that have the query's subject. The
// figures predict whether a portrait's nearest cluster holds portraits.

#include <string>
#include <vector>

#include <opencv2/core.hpp>

namespace vora {
namespace modelkit {

struct LabelledPhoto {
    std::string path;
    std::string subject;
};

// The photos (as ListPhotos finds them) in each sub-folder of dir, labelled
// with the sub-folder's name; sorted by subject, then by file name. Files
// directly in dir are ignored. Throws std::runtime_error when dir cannot be
// read or holds no labelled photo.
std::vector<LabelledPhoto> ListLabelledPhotos(const std::string& dir);

// The Euclidean distance of the library's cluster ordering: squared
// differences summed in single precision in component order, then the root.
float FeatureDistance(const std::vector<float>& a, const std::vector<float>& b);

// The k nearest other photos of features[query], nearest first; equal
// distances keep index order. Fewer when there are fewer other photos.
std::vector<int> NearestNeighbours(const std::vector<std::vector<float>>& features, int query, int k);

// For each photo, the share of its k nearest neighbours whose subject is its
// own (0 when it has no neighbour).
std::vector<double> PrecisionAtK(const std::vector<std::vector<float>>& features,
                                 const std::vector<std::string>& subjects, int k);

struct SubjectPrecision {
    std::string subject;  // "all" for the whole set
    int photos = 0;
    double atOne = 0.0;   // mean precision at 1 over the subject's photos
    double atFive = 0.0;  // mean precision at 5
};

// One row per subject in name order, then "all" (the mean over every photo,
// so large subjects weigh more). A photo alone in its subject scores 0.
// features and subjects have one entry per photo; throws
// std::invalid_argument when their sizes differ.
std::vector<SubjectPrecision> MeasureSubjectPrecision(const std::vector<std::vector<float>>& features,
                                                      const std::vector<std::string>& subjects);

// A plain colour baseline: the photo's pixels in OpenCV's 8-bit Lab (L* x
// 255 / 100, a* + 128, b* + 128), each channel cut into 8 equal bins of 32
// codes, 8 x 8 x 8 = 512 bins indexed L, a, b (L slowest), each holding the
// share of the photo's pixels that fall in it.
std::vector<float> LabHistogram(const cv::Mat& bgr8);

}  // namespace modelkit
}  // namespace vora
