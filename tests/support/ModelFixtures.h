#pragma once

// Small model directories for tests, written by code: the four style database
// files with chosen counts and contents, and a tiny feature network whose
// weights come from the project's own writer.
//
// The fixture network is
//   MemoryData (1 x 3 x 256 x 256; crop 227, per-channel mean_value, scale)
//   -> global average Pooling -> InnerProduct to 512 outputs [-> in-place ReLU]
// so its feature is W * avg((pixel - mean) * scale) + b, easy to compute by
// hand: see ExpectedFeature. Typical use:
//
//   fixtures::FixtureOptions options = fixtures::RandomDatabase(4, 10);
//   options.centres[2] = fixtures::CentreFromFeature(
//       fixtures::ExpectedFeatureForColour(options.network, cv::Vec3b(40, 90, 200)));
//   fixtures::ModelFixture model(options);
//   vora::vora_api api(model.modelDir());   // a uniform content image of that
//                                           // colour now lands in cluster 2

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <opencv2/core.hpp>

#include "model/Engine.h"
#include "model/NetworkWriter.h"
#include "transfer/ColourStatistics.h"

namespace vora {
namespace fixtures {

// ---- Bytes and files ------------------------------------------------------

std::string Int32Bytes(const std::vector<int32_t>& values);  // little-endian
std::string FloatBytes(const std::vector<float>& values);
// Throw std::runtime_error on an I/O failure.
void WriteBytes(const std::string& path, const std::string& bytes);
std::string ReadBytes(const std::string& path);
void TruncateFile(const std::string& path, size_t size);

// ---- The four data files ---------------------------------------------------
// Each writes the count header (the table's size unless `count` is given)
// followed by the contents as given, so a count larger than the contents makes
// a truncated file.

void WriteClusterFile(const std::string& path, const std::vector<ClusterCentre>& centres,
                      std::optional<int32_t> count = std::nullopt);
// Words 0..37 of each record (the percentile words are not stored).
void WriteStyleFile(const std::string& path, const std::vector<ColourStats>& styles,
                    std::optional<int32_t> count = std::nullopt);
// scores: R rows (clusters) of C columns (styles). transposed: the header says
// C, R and the matrix follows column by column, as a swapped writer would.
void WriteScoresFile(const std::string& path, const std::vector<std::vector<float>>& scores,
                     std::optional<int32_t> rows = std::nullopt, std::optional<int32_t> columns = std::nullopt,
                     bool transposed = false);
// The upper triangle (diagonal included, row by row) follows the count.
void WriteDistanceFile(const std::string& path, int32_t count, const std::vector<float>& upperTriangle);
std::vector<float> UpperTriangle(const std::vector<std::vector<float>>& matrix);

// ---- The fixture network ---------------------------------------------------

struct NetworkOptions {
    enum class Files {
        Valid,
        None,               // no network folder at all
        MissingDefinition,  // only the weights
        MissingWeights,     // only the definition
        GarbledDefinition,  // a definition that does not parse
        GarbledWeights,     // weights that do not parse
    };
    Files files = Files::Valid;

    // false: no MemoryData layer; the definition declares a plain input
    // "data" of 1 x 3 x height x width and the network sees raw pixel values.
    bool memoryData = true;
    int height = 256;
    int width = 256;
    int cropSize = 227;  // 0: no crop_size written
    std::vector<float> meanValues = {104.0f, 117.0f, 123.0f};  // written as given: none, one, or per channel
    float scale = 0.015625f;
    bool writeScale = true;  // false: no scale field (the reader's default 1 applies)
    // Write meanBlob (3 x height x width, CV_32F; empty: a fixed gradient) as
    // "mean.binaryproto" beside the definition and name it in mean_file
    // instead of writing mean_value.
    bool meanFile = false;
    cv::Mat meanBlob;

    bool reluOnOutput = false;  // an in-place ReLU on the InnerProduct's top
    int outputs = 512;
    std::vector<float> weights;  // outputs x 3, row-major; empty: DefaultWeights
    std::vector<float> bias;     // outputs; empty: DefaultBias
};

std::vector<float> DefaultWeights(int outputs);
std::vector<float> DefaultBias(int outputs);
// The mean blob the network uses when meanFile is set (options.meanBlob or the gradient).
cv::Mat FixtureMeanBlob(const NetworkOptions& options);

// The definition text and weights layers of the fixture network.
std::string FixtureDefinition(const NetworkOptions& options);
std::vector<WeightsLayer> FixtureWeights(const NetworkOptions& options);

// Writes folder + "deploy2.prototxt" and folder + "caffe_reduce_512_model"
// (and the mean file when asked) as the options say. folder ends in "/".
void WriteFixtureNetwork(const std::string& folder, const NetworkOptions& options);
// Any definition with any weights layers, for tests of the loader itself.
void WriteNetworkFiles(const std::string& folder, const std::string& definition,
                       const std::vector<WeightsLayer>& weights);

// The feature the fixture network gives for an 8-bit, 3-channel B, G, R image
// of the data layer's size (height x width), computed by hand in double from
// the same float input values the library feeds. The network pools in float,
// so expect agreement to about 1e-4 relative, not bit equality.
std::vector<float> ExpectedFeature(const NetworkOptions& options, const cv::Mat& bgr8);
// For an image of one colour (any size the layer accepts). With the crop of
// 227 in 256 this is also the feature of a uniform content image after the
// network input preparation, whose black border the crop removes.
std::vector<float> ExpectedFeatureForColour(const NetworkOptions& options, const cv::Vec3b& bgr);
ClusterCentre CentreFromFeature(const std::vector<float>& feature);  // first 512 values, zero-padded

// ---- Whole model directories -----------------------------------------------

struct FixtureOptions {
    std::vector<ClusterCentre> centres;
    std::vector<ColourStats> styles;
    std::vector<std::vector<float>> scores;     // clusters x styles (no rows: the header says C = styles)
    std::vector<std::vector<float>> distances;  // styles x styles; its upper triangle is written

    // Header counts that disagree with the contents (mismatches, truncation).
    std::optional<int32_t> clusterCount;
    std::optional<int32_t> styleCount;
    std::optional<int32_t> scoreRows;
    std::optional<int32_t> scoreColumns;
    std::optional<int32_t> distanceCount;
    bool transposeScores = false;  // see WriteScoresFile

    // Files left out.
    bool writeClusters = true;
    bool writeStyles = true;
    bool writeScores = true;
    bool writeDistances = true;

    // false: modelDir() is ".../m" with no trailing separator and the network
    // goes where the loader then looks for it, ".../mnet/".
    bool trailingSeparator = true;

    NetworkOptions network;
};

// A consistent database of the given size with distinct values: random
// centres, plausible style records, random scores and a symmetric distance
// matrix with a zero diagonal. The same seed gives the same tables.
FixtureOptions RandomDatabase(int clusters, int styles, uint32_t seed = 1);

// A model directory in a fresh temporary folder, removed again on destruction.
class ModelFixture {
public:
    explicit ModelFixture(const FixtureOptions& options = FixtureOptions());
    ~ModelFixture();
    ModelFixture(ModelFixture&& other) noexcept;
    ModelFixture& operator=(ModelFixture&&) = delete;
    ModelFixture(const ModelFixture&) = delete;
    ModelFixture& operator=(const ModelFixture&) = delete;

    // The directory string to hand to the loader or the facade: ends in "/"
    // ("<root>/model/") unless trailingSeparator was false ("<root>/m").
    const std::string& modelDir() const { return m_modelDir; }
    // The temporary folder holding everything.
    const std::string& root() const { return m_root; }
    // Where the loader reads each file: modelDir + "/" + name, modelDir + "net/" + name.
    std::string DataFile(const char* name) const;
    std::string NetworkFile(const char* name) const;
    const FixtureOptions& options() const { return m_options; }

private:
    std::string m_root;
    std::string m_modelDir;
    FixtureOptions m_options;
};

inline ModelFixture MakeModel(const FixtureOptions& options = FixtureOptions()) { return ModelFixture(options); }

// A fresh empty temporary folder (no trailing separator); the caller removes it.
std::string MakeTempFolder();
void RemoveTree(const std::string& path);

}  // namespace fixtures
}  // namespace vora
