#include "model/MeanBlob.h"

#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <vector>

#include "model/WireReader.h"

namespace vora {

bool ReadWholeFile(const std::string& path, std::string& bytes) {
    // A directory opens as a stream that reads nothing: only regular files count.
    std::error_code error;
    if (!std::filesystem::is_regular_file(path, error)) return false;
    std::ifstream file(path, std::ios::binary);
    if (!file) return false;
    std::ostringstream buffer;
    buffer << file.rdbuf();
    if (file.bad()) return false;
    bytes = buffer.str();
    return true;
}

cv::Mat ReadMeanBlob(const std::string& path, int channels, int height, int width) {
    std::string bytes;
    if (!ReadWholeFile(path, bytes)) CV_Error(cv::Error::StsError, "cannot read the mean file " + path);

    int64_t legacy[4] = {0, 0, 0, 0};  // num, channels, height, width
    bool hasLegacy = false;
    std::vector<int64_t> shape;
    std::vector<float> data;
    std::vector<double> doubleData;
    WireReader reader(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size());
    while (!reader.AtEnd()) {
        const uint64_t key = reader.Varint();
        const int field = static_cast<int>(key >> 3);
        const int wireType = static_cast<int>(key & 7);
        if (field >= 1 && field <= 4 && wireType == 0) {
            legacy[field - 1] = static_cast<int32_t>(reader.Varint());
            hasLegacy = true;
        } else if (field == 5) {
            ReadRepeated(reader, wireType, 5, data, [](WireReader& r) { return r.Fixed<float>(); });
        } else if (field == 8) {
            ReadRepeated(reader, wireType, 1, doubleData, [](WireReader& r) { return r.Fixed<double>(); });
        } else if (field == 7 && wireType == 2) {
            WireReader shapeReader = reader.Sub();
            while (!shapeReader.AtEnd()) {
                const uint64_t shapeKey = shapeReader.Varint();
                if ((shapeKey >> 3) == 1)
                    ReadRepeated(shapeReader, static_cast<int>(shapeKey & 7), 0, shape,
                                 [](WireReader& r) { return static_cast<int64_t>(r.Varint()); });
                else
                    shapeReader.Skip(static_cast<int>(shapeKey & 7));
            }
        } else {
            reader.Skip(wireType);
        }
    }

    // The legacy fields win when present, as in the original reader; a shape
    // of fewer than four axes is read with 1 for the missing trailing axes.
    int64_t dims[4] = {1, 1, 1, 1};
    if (hasLegacy) {
        for (int i = 0; i < 4; ++i) dims[i] = legacy[i];
    } else {
        if (shape.size() > 4) WireReader::Bad("more than four axes");
        for (size_t i = 0; i < shape.size(); ++i) dims[i] = shape[i];
    }
    if (dims[1] != channels || dims[2] != height || dims[3] != width)
        CV_Error(cv::Error::StsBadSize, "mean file " + path + " is " + std::to_string(dims[1]) + " x " +
                                            std::to_string(dims[2]) + " x " + std::to_string(dims[3]) + ", the input is " +
                                            std::to_string(channels) + " x " + std::to_string(height) + " x " +
                                            std::to_string(width));
    const size_t wanted = static_cast<size_t>(channels) * static_cast<size_t>(height) * static_cast<size_t>(width);
    if (data.empty())
        for (double value : doubleData) data.push_back(static_cast<float>(value));
    if (dims[0] < 1 || data.size() != wanted * static_cast<size_t>(dims[0]))
        CV_Error(cv::Error::StsBadSize, "mean file " + path + " holds " + std::to_string(data.size()) +
                                            " values for its shape");

    const int sizes[3] = {channels, height, width};
    cv::Mat mean(3, sizes, CV_32F);
    std::memcpy(mean.ptr<float>(), data.data(), wanted * sizeof(float));  // the first image only
    return mean;
}

}  // namespace vora
