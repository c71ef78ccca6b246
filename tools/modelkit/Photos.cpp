#include "modelkit/Photos.h"

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <stdexcept>

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

namespace fs = std::filesystem;

namespace vora {
namespace modelkit {
namespace {

bool IsPhotoExtension(std::string extension) {
    std::transform(extension.begin(), extension.end(), extension.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    for (const char* known : {".jpg", ".jpeg", ".jpe", ".png", ".tif", ".tiff", ".webp"})
        if (extension == known) return true;
    return false;
}

}  // namespace

std::vector<std::string> ListPhotos(const std::string& dir) {
    std::error_code error;
    if (!fs::is_directory(dir, error)) throw std::runtime_error(dir + " is not a readable folder");
    std::vector<std::string> names;
    for (fs::directory_iterator it(dir, error), end; !error && it != end; it.increment(error)) {
        if (!it->is_regular_file(error)) continue;
        if (IsPhotoExtension(it->path().extension().string())) names.push_back(it->path().filename().string());
    }
    if (error) throw std::runtime_error("cannot list " + dir + ": " + error.message());
    std::sort(names.begin(), names.end());
    std::vector<std::string> paths;
    for (const std::string& name : names) paths.push_back((fs::path(dir) / name).string());
    return paths;
}

cv::Mat ReadPhotoBgr(const std::string& path) {
    cv::Mat image;
    try {
        // ANYCOLOR keeps greyscale as one channel and drops alpha; ANYDEPTH
        // keeps 16-bit samples, which are reduced here rather than truncated.
        image = cv::imread(path, cv::IMREAD_ANYCOLOR | cv::IMREAD_ANYDEPTH);
    } catch (const cv::Exception&) {
        image.release();
    }
    if (image.empty()) throw std::runtime_error("cannot read the photo " + path);

    if (image.depth() == CV_16U) {
        image.convertTo(image, CV_8U, 1.0 / 257.0);
    } else if (image.depth() == CV_32F || image.depth() == CV_64F) {
        image.convertTo(image, CV_8U, 255.0);
    } else if (image.depth() != CV_8U) {
        throw std::runtime_error("the photo " + path + " has a sample type the builder does not read");
    }
    switch (image.channels()) {
        case 1: cv::cvtColor(image, image, cv::COLOR_GRAY2BGR); break;
        case 3: break;
        case 4: cv::cvtColor(image, image, cv::COLOR_BGRA2BGR); break;
        default: throw std::runtime_error("the photo " + path + " has an unusual number of channels");
    }
    return image;
}

bool LooksLikePhotograph(const cv::Mat& image, int minShortSide) {
    if (image.empty() || image.depth() != CV_8U || std::min(image.rows, image.cols) < minShortSide) return false;
    if (image.channels() == 3) return true;
    if (image.channels() != 4) return false;
    cv::Mat alpha;
    cv::extractChannel(image, alpha, 3);
    double lowest = 0.0;
    cv::minMaxLoc(alpha, &lowest);
    return lowest == 255.0;
}

const std::vector<Alteration>& AllAlterations() {
    static const std::vector<Alteration> all{Alteration::Crop80, Alteration::HalfSize, Alteration::Jpeg60,
                                             Alteration::Brighter10, Alteration::Darker10};
    return all;
}

const char* AlterationName(Alteration alteration) {
    switch (alteration) {
        case Alteration::Crop80: return "crop 80 %";
        case Alteration::HalfSize: return "half size";
        case Alteration::Jpeg60: return "JPEG quality 60";
        case Alteration::Brighter10: return "brightness +10 %";
        case Alteration::Darker10: return "brightness -10 %";
    }
    return "?";
}

cv::Mat Alter(const cv::Mat& bgr8, Alteration alteration) {
    cv::Mat out;
    switch (alteration) {
        case Alteration::Crop80: {
            const int width = std::max(1, static_cast<int>(std::lround(bgr8.cols * 0.8)));
            const int height = std::max(1, static_cast<int>(std::lround(bgr8.rows * 0.8)));
            out = bgr8(cv::Rect((bgr8.cols - width) / 2, (bgr8.rows - height) / 2, width, height)).clone();
            break;
        }
        case Alteration::HalfSize: {
            const cv::Size size(std::max(1, (bgr8.cols + 1) / 2), std::max(1, (bgr8.rows + 1) / 2));
            cv::resize(bgr8, out, size, 0, 0, cv::INTER_AREA);
            break;
        }
        case Alteration::Jpeg60: {
            std::vector<uchar> bytes;
            cv::imencode(".jpg", bgr8, bytes, {cv::IMWRITE_JPEG_QUALITY, 60});
            out = cv::imdecode(bytes, cv::IMREAD_COLOR);
            break;
        }
        case Alteration::Brighter10: bgr8.convertTo(out, CV_8U, 1.1); break;
        case Alteration::Darker10: bgr8.convertTo(out, CV_8U, 0.9); break;
    }
    return out;
}

}  // namespace modelkit
}  // namespace vora
