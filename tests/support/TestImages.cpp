#include "support/TestImages.h"

#include <algorithm>
#include <cmath>
#include <iterator>
#include <set>
#include <string>

#include <opencv2/imgproc.hpp>

namespace vora {
namespace testimages {

cv::Mat SyntheticPhotoRgb(int rows, int cols, uint32_t seed) {
    cv::RNG rng(seed);
    cv::Mat image(rows, cols, CV_32FC3);
    const float phase = static_cast<float>(rng.uniform(0.0, 6.28));
    for (int r = 0; r < rows; ++r) {
        for (int c = 0; c < cols; ++c) {
            const float y = static_cast<float>(r) / rows, x = static_cast<float>(c) / cols;
            image.at<cv::Vec3f>(r, c) = cv::Vec3f(60.0f + 150.0f * y, 90.0f + 80.0f * std::sin(6.0f * x + phase),
                                                  200.0f - 140.0f * x * y);
        }
    }
    for (int i = 0; i < 6; ++i) {
        const cv::Point centre(rng.uniform(0, cols), rng.uniform(0, rows));
        const int radius = rng.uniform(std::max(2, cols / 20), std::max(3, cols / 5));
        cv::circle(image, centre, radius, cv::Scalar(rng.uniform(0, 255), rng.uniform(0, 255), rng.uniform(0, 255)),
                   cv::FILLED, cv::LINE_AA);
    }
    // A dark "face" a little left of centre.
    cv::ellipse(image, cv::Point(cols * 2 / 5, rows * 2 / 5), cv::Size(std::max(1, cols / 10), std::max(1, rows / 7)),
                0, 0, 360, cv::Scalar(70, 45, 35), cv::FILLED, cv::LINE_AA);
    const int blur = std::max(1, std::min(rows, cols) / 60) * 2 + 1;
    cv::GaussianBlur(image, image, cv::Size(blur, blur), 0);
    cv::Mat noise(rows, cols, CV_32FC3);
    cv::randn(noise, 0.0, 3.0);
    image += noise;
    cv::Mat rgb;
    image.convertTo(rgb, CV_8UC3);
    return rgb;
}

ImageHandle::ImageHandle(cv::Mat& rgb) {
    const size_t layout[4] = {0, 0, 0, 0};
    image = CreateImageObj(rgb.rows, rgb.cols, rgb.channels(), layout, rgb.data,
                           CFullResImageSize(rgb.cols, rgb.rows), CTopLeftCoordinate(0, 0));
}

ImageHandle::~ImageHandle() { DestroyImageObj(image); }

bool SameRecord(const TRANSFER& a, const TRANSFER& b) {
    // The fixed fields are 4-byte values in a row from clusterIndex to lightnessHigh, then the faces.
    const auto bytes = [](const TRANSFER& t) {
        const char* first = reinterpret_cast<const char*>(&t.clusterIndex);
        return std::string(first, reinterpret_cast<const char*>(&t.lightnessHigh + 1)) +
               std::string(reinterpret_cast<const char*>(t.faceCorrections.data()),
                           t.faceCorrections.size() * sizeof(FaceCorrection));
    };
    return bytes(a) == bytes(b);
}

ImagePtr Tile(cv::Mat& m, cv::Rect r) {
    const size_t layout[4] = {};
    return ImagePtr(GetTileImageObj(r.height, r.width, m.channels(), layout, m.ptr(r.y, r.x),
                                    CFullResImageSize(m.cols, m.rows), CTopLeftCoordinate(r.x, r.y)));
}

std::vector<cv::Rect> RandomTiling1500x1000(std::mt19937& random, int extraCuts) {
    std::set<int> xs = {0, 675, 799, 1500}, ys = {0, 349, 410, 1000};
    for (int i = 0; i < extraCuts; ++i) {
        xs.insert(1 + random() % 1499);
        ys.insert(1 + random() % 999);
    }
    std::vector<cv::Rect> tiles;
    for (auto y = ys.begin(); std::next(y) != ys.end(); ++y)
        for (auto x = xs.begin(); std::next(x) != xs.end(); ++x)
            tiles.emplace_back(cv::Point(*x, *y), cv::Point(*std::next(x), *std::next(y)));
    std::shuffle(tiles.begin(), tiles.end(), random);
    return tiles;
}

}  // namespace testimages
}  // namespace vora
