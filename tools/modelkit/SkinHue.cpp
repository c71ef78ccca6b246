#include "modelkit/SkinHue.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <vector>

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

namespace vora {
namespace modelkit {

namespace {

constexpr double kPi = 3.14159265358979323846;

double Median(std::vector<float>& values) {
    const size_t middle = values.size() / 2;
    std::nth_element(values.begin(), values.begin() + middle, values.end());
    double upper = values[middle];
    if (values.size() % 2 == 1) return upper;
    const double lower = *std::max_element(values.begin(), values.begin() + middle);
    return (lower + upper) / 2;
}

}  // namespace

double SkinColour::HueDegrees() const {
    const double degrees = std::atan2(b, a) * 180.0 / kPi;
    return degrees < 0 ? degrees + 360.0 : degrees;
}

bool ParseFaceRect(const std::string& text, CFaceRect& box) {
    char tail = 0;
    CFaceRect parsed(0, 0, 0, 0);
    if (std::sscanf(text.c_str(), "%lf,%lf,%lf,%lf%c", &parsed.left, &parsed.right, &parsed.top, &parsed.bottom, &tail) != 4)
        return false;
    if (!(0 <= parsed.left && parsed.left < parsed.right && parsed.right <= 1)) return false;
    if (!(0 <= parsed.top && parsed.top < parsed.bottom && parsed.bottom <= 1)) return false;
    box = parsed;
    return true;
}

bool MeasureSkin(const cv::Mat& bgr, const CFaceRect& box, SkinColour& colour) {
    if (bgr.empty() || bgr.type() != CV_8UC3) return false;
    // Pixels whose centres fall inside the box; at least one.
    const auto span = [](double from, double to, int size) {
        int first = std::clamp(static_cast<int>(std::lround(from * size)), 0, size - 1);
        int last = std::clamp(static_cast<int>(std::lround(to * size)), first + 1, size);
        return cv::Range(first, last);
    };
    cv::Mat face;
    bgr(span(box.top, box.bottom, bgr.rows), span(box.left, box.right, bgr.cols)).convertTo(face, CV_32F, 1.0 / 255);
    cv::Mat lab;
    cv::cvtColor(face, lab, cv::COLOR_BGR2Lab);
    std::vector<float> a, b;
    a.reserve(lab.total());
    b.reserve(lab.total());
    for (int y = 0; y < lab.rows; ++y) {
        const cv::Vec3f* row = lab.ptr<cv::Vec3f>(y);
        for (int x = 0; x < lab.cols; ++x) {
            a.push_back(row[x][1]);
            b.push_back(row[x][2]);
        }
    }
    colour.a = Median(a);
    colour.b = Median(b);
    return true;
}

bool MeasureSkin(const std::string& path, const CFaceRect& box, SkinColour& colour) {
    return MeasureSkin(cv::imread(path, cv::IMREAD_COLOR), box, colour);
}

double HueTurn(const SkinColour& from, const SkinColour& to) {
    double turn = to.HueDegrees() - from.HueDegrees();
    while (turn > 180) turn -= 360;
    while (turn <= -180) turn += 360;
    return turn;
}

}  // namespace modelkit
}  // namespace vora
