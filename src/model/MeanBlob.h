#pragma once

#include <string>

#include <opencv2/core.hpp>

namespace vora {

// Reads a mean blob file (the weights format's BlobProto: `shape` or the
// num/channels/height/width fields, data as float or double) and returns its
// first image as a channels x height x width CV_32F matrix. Throws
// cv::Exception when the file cannot be read or does not hold that shape.
cv::Mat ReadMeanBlob(const std::string& path, int channels, int height, int width);

// The whole file into bytes; false when it cannot be read.
bool ReadWholeFile(const std::string& path, std::string& bytes);

}  // namespace vora
