#include "model/StyleDatabase.h"

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <limits>
#include <memory>
#include <vector>

#include <opencv2/core.hpp>

#include "model/Engine.h"

// All four files are little-endian, as this machine is: values are read
// straight into memory. Reads are byte-counted and never checked, so a short
// file leaves the rest of a zero-filled buffer at zero instead of failing. That
// zero tail is bounded before anything is allocated: a few bytes must not make
// the library ask for gigabytes (see Affords).

namespace vora {

namespace {

struct FileCloser {
    void operator()(std::FILE* file) const { std::fclose(file); }
};
using File = std::unique_ptr<std::FILE, FileCloser>;

File OpenForReading(const std::string& path) { return File(std::fopen(path.c_str(), "rb")); }

// The bytes the file holds (0 when it cannot be told, e.g. a directory).
uint64_t FileBytes(std::FILE* file) {
    if (std::fseek(file, 0, SEEK_END) != 0) return 0;
    const long end = std::ftell(file);
    std::rewind(file);
    return end > 0 ? static_cast<uint64_t>(end) : 0;
}

// Whether a file of `fileBytes` may stand for `header` bytes and `count`
// items of `itemBytes`: the part it lacks, read as zeros, may be as large as
// the file itself or kZeroTailBytes, whichever is larger. Memory then follows
// the file's size, not its header's claims. Counts are below 2^31 and items
// small, so the product cannot overflow.
constexpr uint64_t kZeroTailBytes = uint64_t{16} << 20;
bool Affords(uint64_t fileBytes, uint64_t header, uint64_t count, uint64_t itemBytes) {
    return header + count * itemBytes <= fileBytes + std::max(fileBytes, kZeroTailBytes);
}

// Reads up to `bytes` bytes; whatever the file lacks stays as it was (zero).
void ReadBytes(std::FILE* file, void* into, size_t bytes) {
    if (bytes > 0) (void)std::fread(into, 1, bytes, file);
}

// A header count; an empty file reads as 0, and so does a header of 1 to 3
// bytes (a partial count cannot be trusted).
int32_t ReadCount(std::FILE* file) {
    int32_t count = 0;
    if (std::fread(&count, 1, sizeof count, file) != sizeof count) return 0;
    return count;
}

ReadResult ReadDistances(Engine& engine, const std::string& modelDir) {
    File file = OpenForReading(DataFilePath(modelDir, kDistanceFileName));
    if (!file) return ReadResult::CannotOpen;
    const uint64_t bytes = FileBytes(file.get());
    const int32_t n = ReadCount(file.get());
    if (n != engine.styleCount) return ReadResult::SizeMismatch;

    // n == styleCount >= 0 here: a negative style count is stored as 0. The
    // file holds the upper triangle, diagonal included.
    const size_t size = static_cast<size_t>(n);
    if (!Affords(bytes, sizeof(int32_t), static_cast<uint64_t>(size) * (size + 1) / 2, sizeof(float)))
        return ReadResult::SizeMismatch;
    engine.styleDistances.assign(size, std::vector<float>());
    for (size_t i = 0; i < size; ++i) {
        std::vector<float>& row = engine.styleDistances[i];
        row.assign(size, 0.0f);
        ReadBytes(file.get(), row.data() + i, (size - i) * sizeof(float));
    }
    file.reset();

    for (size_t i = 0; i < size; ++i)
        for (size_t j = 0; j < i; ++j) engine.styleDistances[i][j] = engine.styleDistances[j][i];
    return ReadResult::Ok;
}

}  // namespace

std::string DataFilePath(const std::string& modelDir, const char* name) {
    return modelDir + "/" + name;
}

void ReadClusterCentres(Engine& engine, const std::string& modelDir) {
    File file = OpenForReading(DataFilePath(modelDir, kClusterFileName));
    if (!file) return;
    const uint64_t bytes = FileBytes(file.get());
    // A negative count is read as an empty table, and so is one the file cannot hold.
    int32_t count = std::max<int32_t>(ReadCount(file.get()), 0);
    if (!Affords(bytes, sizeof(int32_t), static_cast<uint64_t>(count), sizeof(ClusterCentre))) count = 0;
    engine.clusterCount = count;
    engine.clusterCentres.assign(static_cast<size_t>(count), ClusterCentre{});
    for (ClusterCentre& centre : engine.clusterCentres)
        ReadBytes(file.get(), centre.data(), centre.size() * sizeof(float));
}

ReadResult ReadStyleRecords(Engine& engine, const std::string& path) {
    File file = OpenForReading(path);
    if (!file) return ReadResult::CannotOpen;
    const uint64_t bytes = FileBytes(file.get());
    // A negative count is read as an empty table.
    const int32_t count = std::max<int32_t>(ReadCount(file.get()), 0);
    constexpr uint64_t kStoredBytes = 38 * sizeof(float);  // the two percentile words are not stored
    if (!Affords(bytes, sizeof(int32_t), static_cast<uint64_t>(count), kStoredBytes)) {
        engine.styleCount = 0;
        engine.styleRecords.clear();
        return ReadResult::SizeMismatch;
    }
    engine.styleCount = count;
    engine.styleRecords.assign(static_cast<size_t>(count), ColourStats{});
    for (ColourStats& record : engine.styleRecords) {
        // Mean (2), square root of the covariance (4), lightness samples (32);
        // the two percentile words are not stored in the file and stay zero.
        ReadBytes(file.get(), record.chromaMean, sizeof record.chromaMean);
        ReadBytes(file.get(), record.chromaSqrtCov, sizeof record.chromaSqrtCov);
        ReadBytes(file.get(), record.lightness, sizeof record.lightness);
    }
    return ReadResult::Ok;
}

ReadResult ReadScoresAndDistances(Engine& engine, const std::string& modelDir) {
    File file = OpenForReading(DataFilePath(modelDir, kScoresFileName));
    if (!file) return ReadResult::CannotOpen;
    const uint64_t bytes = FileBytes(file.get());
    const int32_t rows = ReadCount(file.get());
    const int32_t columns = ReadCount(file.get());
    engine.scoreColumns = columns;

    // The counts are compared before the score buffer is allocated: a rejected
    // file stores nothing else either way, and this bounds the buffer by tables
    // already loaded. Counts that are negative or whose product leaves the
    // int32 range cannot describe a buffer and are rejected as a mismatch.
    if (rows != engine.clusterCount || columns != engine.styleCount) return ReadResult::SizeMismatch;
    if (rows < 0 || columns < 0) return ReadResult::SizeMismatch;
    const int64_t total = static_cast<int64_t>(rows) * columns;
    if (total > std::numeric_limits<int32_t>::max()) return ReadResult::SizeMismatch;
    if (!Affords(bytes, 2 * sizeof(int32_t), static_cast<uint64_t>(total), sizeof(float))) return ReadResult::SizeMismatch;

    std::vector<float> scores(static_cast<size_t>(total), 0.0f);
    ReadBytes(file.get(), scores.data(), scores.size() * sizeof(float));
    file.reset();

    const size_t columnCount = static_cast<size_t>(columns);
    const size_t kept = columnCount / 2;  // only the better half of the styles is ranked
    engine.rankedStyles.assign(static_cast<size_t>(rows), std::vector<int32_t>(columnCount, -1));
    if (rows > 0 && columns > 0) {
        const cv::Mat scoreMatrix(rows, columns, CV_32F, scores.data());
        cv::Mat order;
        cv::sortIdx(scoreMatrix, order, cv::SORT_EVERY_ROW | cv::SORT_DESCENDING);
        for (int r = 0; r < rows; ++r) {
            const int* sorted = order.ptr<int>(r);
            std::vector<int32_t>& ranked = engine.rankedStyles[static_cast<size_t>(r)];
            for (size_t c = 0; c < kept; ++c) ranked[c] = sorted[c];
        }
    }

    return ReadDistances(engine, modelDir);
}

}  // namespace vora
