#pragma once

// Helpers shared by the model kit's tests.

#include <filesystem>
#include <string>

#include <gtest/gtest.h>
#include <opencv2/imgproc.hpp>

#include "modelkit/ModelBuilder.h"
#include "support/ModelFixtures.h"

namespace kit_testing {

namespace fs = std::filesystem;

// A fresh folder, removed with everything in it at the end of its life.
struct TempDir : vora::fixtures::TempFolder {
    const fs::path path{TempFolder::path()};
};

inline std::string ReadBytes(const fs::path& path) { return vora::fixtures::ReadBytes(path.string()); }

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
