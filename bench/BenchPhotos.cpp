#include "BenchPhotos.h"

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

namespace vora {
namespace bench {

const cv::Mat& Photo24() {
    static const cv::Mat photo = [] {
        namespace fs = std::filesystem;
        const fs::path styles = fs::path(VORA_SOURCE_DIR) / ".cache/photos/styles";
        fs::path largest;
        std::uintmax_t largestSize = 0;
        std::error_code error;
        for (const auto& entry : fs::directory_iterator(styles, error)) {
            if (entry.path().extension() == ".jpg" && entry.file_size() > largestSize) {
                largestSize = entry.file_size();
                largest = entry.path();
            }
        }
        cv::Mat result;
        const cv::Mat bgr = largest.empty() ? cv::Mat() : cv::imread(largest.string(), cv::IMREAD_COLOR);
        if (bgr.empty()) return result;
        cv::Mat big, noise(4000, 6000, CV_16SC3);
        cv::resize(bgr, big, noise.size(), 0, 0, cv::INTER_CUBIC);
        cv::RNG random(20261124);
        random.fill(noise, cv::RNG::NORMAL, 0, 1.5);
        big.convertTo(big, CV_16SC3);
        cv::add(big, noise, big);
        big.convertTo(big, CV_8UC3);
        cv::cvtColor(big, result, cv::COLOR_BGR2RGB);
        return result;
    }();
    return photo;
}

double DistinctColours(const cv::Mat& rgb) {
    std::vector<bool> seen(size_t{1} << 24);
    double count = 0;
    for (int r = 0; r < rgb.rows; ++r) {
        const uint8_t* p = rgb.ptr<uint8_t>(r);
        for (int c = 0; c < rgb.cols; ++c, p += 3) {
            const size_t key = size_t{p[0]} << 16 | size_t{p[1]} << 8 | p[2];
            if (!seen[key]) {
                seen[key] = true;
                ++count;
            }
        }
    }
    return count;
}

namespace {

double StatusField(const char* name) {
    std::ifstream status("/proc/self/status");
    std::string line;
    const std::string prefix = std::string(name) + ":";
    while (std::getline(status, line))
        if (line.compare(0, prefix.size(), prefix) == 0) return std::stod(line.substr(prefix.size())) * 1024.0;
    return 0.0;
}

}  // namespace

// Writing 5 to clear_refs resets the peak to the current resident size.
void ResetPeakMemory() { std::ofstream("/proc/self/clear_refs") << "5"; }
double PeakMemory() { return StatusField("VmHWM"); }
double CurrentMemory() { return StatusField("VmRSS"); }

}  // namespace bench
}  // namespace vora
