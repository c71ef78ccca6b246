#pragma once

// Helpers shared by the model kit's tests.

#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <string>

#include <gtest/gtest.h>
#include <opencv2/imgproc.hpp>

#include "modelkit/ModelBuilder.h"

namespace kit_testing {

namespace fs = std::filesystem;

// A fresh folder, removed with everything in it at the end of its life.
struct TempDir {
    fs::path path;
    TempDir() {
        std::string pattern = (fs::temp_directory_path() / "vora_kit_XXXXXX").string();
        if (!::mkdtemp(&pattern[0])) throw std::runtime_error("cannot make a scratch folder");
        path = pattern;
    }
    ~TempDir() { fs::remove_all(path); }
};

inline std::string ReadBytes(const fs::path& path) {
    std::ifstream file(path, std::ios::binary);
    std::ostringstream out;
    out << file.rdbuf();
    return out.str();
}

// A smooth random colour field, different for each seed.
inline cv::Mat Scene(int seed, int rows = 96, int cols = 128) {
    cv::Mat coarse(rows / 12 + 2, cols / 12 + 2, CV_8UC3), image;
    cv::RNG(seed).fill(coarse, cv::RNG::UNIFORM, 0, 256);
    cv::resize(coarse, image, cv::Size(cols, rows), 0, 0, cv::INTER_CUBIC);
    return image;
}

inline void Build(const fs::path& styles, const fs::path& out, int clusters = 0, const fs::path& content = {}) {
    vora::modelkit::BuildModel({styles.string(), content.string(), out.string(), clusters, {}, nullptr});
}

}  // namespace kit_testing
