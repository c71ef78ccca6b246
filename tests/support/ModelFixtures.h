#pragma once

// Small model directories for tests, written by code: the four style database
// files with chosen counts and contents, and a tiny feature network whose
// weights come from the project's own writer.
//
// The fixture network is
//   MemoryData (1 x 3 x 256 x 256; crop, mean, scale)
//   -> global average Pooling -> InnerProduct to `outputs`
// so its feature is W * avg(input blob) + b, easy to compute by hand
// (ExpectedFeature), e.g. to place a cluster centre on a chosen colour.

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <opencv2/core.hpp>

#include "model/Engine.h"
#include "modelkit/NetworkWriter.h"

namespace vora {
namespace fixtures {

// Throw std::runtime_error on an I/O failure.
void WriteBytes(const std::string& path, const std::string& bytes);
std::string ReadBytes(const std::string& path);  // empty when unreadable or a folder
void TruncateFile(const std::string& path, size_t size);
// A data file as the readers expect it: int32 header words, then float values.
void WriteDataFile(const std::string& path, const std::vector<int32_t>& header, const std::vector<float>& values);

struct NetworkOptions {
    // None: no network folder; MissingWeights: only the definition; Garbled*: a file that does not parse;
    // EmptyWeights: a weights file of no bytes; WeightsFolder: a folder where the weights file belongs.
    enum class Files { Valid, None, MissingWeights, GarbledDefinition, GarbledWeights, EmptyWeights, WeightsFolder };
    Files files = Files::Valid;

    // false: a plain input "data" of 1 x 3 x 256 x 256, fed raw pixel values.
    bool memoryData = true;
    int cropSize = 227;                                        // 0: no crop_size written
    std::vector<float> meanValues = {104.0f, 117.0f, 123.0f};  // written as given: none, one, or per channel
    float scale = 0.015625f;
    bool writeScale = true;  // false: no scale field
    bool meanFile = false;   // RandomMean(256, 256) in "mean.binaryproto" instead of mean_value
    int outputs = 512;
};

// A 3 x height x width CV_32F mean blob of distinct values, the same for the same size.
cv::Mat RandomMean(int height, int width);

// Writes folder + the definition and weights file names (folder ends in "/").
void WriteFixtureNetwork(const std::string& folder, const NetworkOptions& options);
void WriteNetworkFiles(const std::string& folder, const std::string& definition,
                       const std::vector<WeightsLayer>& weights);

// The input blob written out plainly: centre crop, (pixel - mean) x scale in
// float, plane by plane (1 x 3 x h x w), for an 8-bit B, G, R image.
cv::Mat HandInputBlob(const cv::Mat& bgr8, const InputTransform& transform);
// The fixture network's feature for a 256 x 256 B, G, R image, computed by hand
// in double from HandInputBlob: expect agreement to about 1e-4, not bit equality.
std::vector<float> ExpectedFeature(const NetworkOptions& options, const cv::Mat& bgr8);

struct FixtureOptions {
    std::vector<ClusterCentre> centres;
    std::vector<ColourStats> styles;
    std::vector<std::vector<float>> scores;     // clusters x styles
    std::vector<std::vector<float>> distances;  // styles x styles; its upper triangle is written

    // Header counts that disagree with the contents.
    std::optional<int32_t> clusterCount, styleCount, scoreRows, scoreColumns, distanceCount;
    bool transposeScores = false;  // header C, R and the matrix column by column

    bool writeClusters = true, writeStyles = true, writeScores = true, writeDistances = true;

    NetworkOptions network;
};

// A consistent database with distinct random values (symmetric distances with
// a zero diagonal). The same seed gives the same tables.
FixtureOptions RandomDatabase(int clusters, int styles, uint32_t seed = 1);

// A fresh temporary folder (its path has no trailing separator), removed
// with everything in it when the object goes, however the test ends.
class TempFolder {
public:
    TempFolder();
    ~TempFolder();
    TempFolder(const TempFolder&) = delete;
    TempFolder& operator=(const TempFolder&) = delete;
    const std::string& path() const { return m_path; }

private:
    std::string m_path;
};

// A model directory in a fresh temporary folder, removed on destruction.
class ModelFixture {
public:
    explicit ModelFixture(const FixtureOptions& options = FixtureOptions());

    // "<root>/model/"
    const std::string& modelDir() const { return m_modelDir; }
    const std::string& root() const { return m_root; }
    std::string DataFile(const char* name) const;  // where the loader reads it

private:
    TempFolder m_folder;  // first: a constructor that throws still removes it
    std::string m_root = m_folder.path(), m_modelDir = m_root + "/model/";
};

}  // namespace fixtures
}  // namespace vora
