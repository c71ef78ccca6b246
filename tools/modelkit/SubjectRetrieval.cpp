#include "modelkit/SubjectRetrieval.h"

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <map>
#include <stdexcept>
#include <system_error>

#include <opencv2/imgproc.hpp>

#include "modelkit/Photos.h"

namespace fs = std::filesystem;

namespace vora {
namespace modelkit {

std::vector<LabelledPhoto> ListLabelledPhotos(const std::string& dir) {
    std::error_code error;
    std::vector<std::string> subjects;
    for (fs::directory_iterator it(dir, error), end; !error && it != end; it.increment(error))
        if (it->is_directory()) subjects.push_back(it->path().filename().string());
    if (error) throw std::runtime_error("cannot read the folder " + dir + ": " + error.message());
    std::sort(subjects.begin(), subjects.end());

    std::vector<LabelledPhoto> photos;
    for (const std::string& subject : subjects)
        for (std::string& path : ListPhotos((fs::path(dir) / subject).string()))
            photos.push_back({std::move(path), subject});
    if (photos.empty())
        throw std::runtime_error("no photos in the sub-folders of " + dir +
                                 " (expected one folder per subject, e.g. " + dir + "/people/)");
    return photos;
}

float FeatureDistance(const std::vector<float>& a, const std::vector<float>& b) {
    float sum = 0.0f;
    for (size_t i = 0; i < a.size() && i < b.size(); ++i) {
        const float d = a[i] - b[i];
        sum += d * d;
    }
    return std::sqrt(sum);
}

std::vector<int> NearestNeighbours(const std::vector<std::vector<float>>& features, int query, int k) {
    std::vector<std::pair<float, int>> others;
    for (int i = 0; i < static_cast<int>(features.size()); ++i)
        if (i != query) others.emplace_back(FeatureDistance(features[query], features[i]), i);
    const size_t keep = std::min(others.size(), static_cast<size_t>(std::max(k, 0)));
    // Pairs compare by distance, then index: equal distances keep index order.
    std::partial_sort(others.begin(), others.begin() + keep, others.end());
    std::vector<int> nearest(keep);
    for (size_t i = 0; i < keep; ++i) nearest[i] = others[i].second;
    return nearest;
}

std::vector<double> PrecisionAtK(const std::vector<std::vector<float>>& features,
                                 const std::vector<std::string>& subjects, int k) {
    std::vector<double> precision(features.size(), 0.0);
    for (size_t q = 0; q < features.size(); ++q) {
        const std::vector<int> nearest = NearestNeighbours(features, static_cast<int>(q), k);
        if (nearest.empty()) continue;
        const auto same = std::count_if(nearest.begin(), nearest.end(),
                                        [&](int i) { return subjects[i] == subjects[q]; });
        precision[q] = double(same) / double(nearest.size());
    }
    return precision;
}

std::vector<SubjectPrecision> MeasureSubjectPrecision(const std::vector<std::vector<float>>& features,
                                                      const std::vector<std::string>& subjects) {
    if (features.size() != subjects.size())
        throw std::invalid_argument("one subject per feature expected");
    const std::vector<double> atOne = PrecisionAtK(features, subjects, 1);
    const std::vector<double> atFive = PrecisionAtK(features, subjects, 5);

    std::map<std::string, SubjectPrecision> bySubject;
    SubjectPrecision all{"all"};
    for (size_t i = 0; i < subjects.size(); ++i) {
        for (SubjectPrecision* row : {&bySubject[subjects[i]], &all}) {
            ++row->photos;
            row->atOne += atOne[i];
            row->atFive += atFive[i];
        }
    }
    std::vector<SubjectPrecision> rows;
    for (auto& [subject, row] : bySubject) {
        row.subject = subject;
        rows.push_back(row);
    }
    rows.push_back(all);
    for (SubjectPrecision& row : rows) {
        row.atOne /= row.photos > 0 ? row.photos : 1;
        row.atFive /= row.photos > 0 ? row.photos : 1;
    }
    return rows;
}

std::vector<float> LabHistogram(const cv::Mat& bgr8) {
    CV_Assert(bgr8.type() == CV_8UC3);
    cv::Mat lab;
    cv::cvtColor(bgr8, lab, cv::COLOR_BGR2Lab);
    std::vector<float> histogram(512, 0.0f);
    if (lab.empty()) return histogram;
    std::vector<double> counts(512, 0.0);
    for (int r = 0; r < lab.rows; ++r) {
        const cv::Vec3b* row = lab.ptr<cv::Vec3b>(r);
        for (int c = 0; c < lab.cols; ++c) counts[(row[c][0] >> 5) * 64 + (row[c][1] >> 5) * 8 + (row[c][2] >> 5)] += 1.0;
    }
    const double pixels = double(lab.rows) * lab.cols;
    for (size_t i = 0; i < counts.size(); ++i) histogram[i] = static_cast<float>(counts[i] / pixels);
    return histogram;
}

}  // namespace modelkit
}  // namespace vora
