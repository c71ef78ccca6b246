#include "vora/ModelFiles.h"

#include <cmath>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <limits>

#include "model/ModelFileNames.h"

namespace vora {
namespace cli {
namespace {

namespace fs = std::filesystem;

constexpr uint64_t kCentreBytes = 512 * 4;
constexpr uint64_t kStyleRecordBytes = 152;  // 38 floats

std::string Plural(int64_t n, const char* one, const char* many) {
    return std::to_string(n) + " " + (n == 1 ? one : many);
}

ModelFile Probe(const std::string& dir, const char* name) {
    ModelFile file;
    file.name = name;
    file.path = (fs::path(dir) / name).string();
    std::error_code ec;
    file.present = fs::is_regular_file(file.path, ec);
    if (file.present) file.size = fs::file_size(file.path, ec);
    return file;
}

// The data files are little-endian, as is every machine the library runs on.
bool ReadAll(const ModelFile& file, std::vector<char>& bytes) {
    std::ifstream in(file.path, std::ios::binary);
    if (!in) return false;
    bytes.assign(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
    return !in.bad();
}

int32_t Int32At(const std::vector<char>& bytes, size_t offset) {
    int32_t v;
    std::memcpy(&v, bytes.data() + offset, 4);
    return v;
}

float FloatAt(const std::vector<char>& bytes, size_t offset) {
    float v;
    std::memcpy(&v, bytes.data() + offset, 4);
    return v;
}

// Counts floats that are not finite among those present in [begin, end).
uint64_t CountNonFinite(const std::vector<char>& bytes, uint64_t begin, uint64_t end) {
    end = std::min<uint64_t>(end, bytes.size());
    uint64_t count = 0;
    for (uint64_t at = begin; at + 4 <= end; at += 4)
        if (!std::isfinite(FloatAt(bytes, at))) ++count;
    return count;
}

class Examiner {
public:
    explicit Examiner(ModelExamination& m) : m_(m) {}

    void Problem(const std::string& text) { m_.problems.push_back(text); }
    void Remark(const std::string& text) { m_.remarks.push_back(text); }

    // Common start for the four data files: present, readable, header there.
    bool Open(ModelFile& file, size_t headerBytes, std::vector<char>& bytes) {
        if (!file.present) {
            std::error_code ec;
            if (fs::exists(file.path, ec))
                Problem(file.name + " is not a regular file");
            else
                Problem(file.name + " is missing");
            return false;
        }
        if (!ReadAll(file, bytes)) {
            Problem(file.name + " cannot be read");
            return false;
        }
        if (bytes.size() < headerBytes) {
            Problem(file.name + " is too short to hold its header (" + std::to_string(bytes.size()) + " bytes, needs " +
                    std::to_string(headerBytes) + ")");
            return false;
        }
        return true;
    }

    void CheckSize(const ModelFile& file) {
        if (file.size < file.expectedSize)
            Problem(file.name + " is truncated: its header promises " + std::to_string(file.expectedSize) +
                    " bytes, the file has " + std::to_string(file.size) +
                    " (the library would read zeros for the missing part)");
        else if (file.size > file.expectedSize)
            Remark(file.name + " has " + std::to_string(file.size - file.expectedSize) +
                   " bytes beyond what its header promises; the library ignores them");
    }

    void NonFinite(const ModelFile& file, uint64_t count, const char* what) {
        if (count > 0)
            Problem(file.name + " holds " + std::to_string(count) + " " + what + " that are not finite numbers");
    }

    void Clusters() {
        std::vector<char> bytes;
        ModelFile& file = m_.clusters;
        if (!Open(file, 4, bytes)) return;
        const int32_t k = Int32At(bytes, 0);
        if (k < 0) {
            Problem(file.name + " claims a negative number of clusters (" + std::to_string(k) + ")");
            return;
        }
        m_.clusterCount = k;
        file.headerRead = true;
        file.expectedSize = 4 + kCentreBytes * static_cast<uint64_t>(k);
        file.contents = Plural(k, "cluster centre", "cluster centres") + " of 512 values";
        if (k == 0) Problem(file.name + " holds no clusters");
        CheckSize(file);
        NonFinite(file, CountNonFinite(bytes, 4, file.expectedSize), "centre values");
    }

    void Styles() {
        std::vector<char> bytes;
        ModelFile& file = m_.styles;
        if (!Open(file, 4, bytes)) return;
        const int32_t s = Int32At(bytes, 0);
        if (s < 0) {
            Problem(file.name + " claims a negative number of styles (" + std::to_string(s) + ")");
            return;
        }
        m_.styleCount = s;
        file.headerRead = true;
        file.expectedSize = 4 + kStyleRecordBytes * static_cast<uint64_t>(s);
        file.contents = Plural(s, "style record", "style records");
        if (s == 0) Problem(file.name + " holds no styles");
        CheckSize(file);
        NonFinite(file, CountNonFinite(bytes, 4, file.expectedSize), "statistics values");
        // Lightness samples are a sorted distribution within [0, 1].
        uint64_t unsorted = 0;
        const uint64_t records = std::min<uint64_t>(s, (bytes.size() - 4) / kStyleRecordBytes);
        for (uint64_t r = 0; r < records; ++r) {
            const size_t base = 4 + r * kStyleRecordBytes + 24;
            bool bad = false;
            for (int i = 0; i < 32; ++i) {
                const float v = FloatAt(bytes, base + 4 * i);
                if (!(v >= 0.0f && v <= 1.0f) || (i > 0 && v < FloatAt(bytes, base + 4 * (i - 1)))) bad = true;
            }
            unsorted += bad;
        }
        if (unsorted > 0)
            Remark(file.name + ": " + Plural(static_cast<int64_t>(unsorted), "style has", "styles have") +
                   " lightness samples that are not ascending within 0..1");
    }

    void Scores() {
        std::vector<char> bytes;
        ModelFile& file = m_.scores;
        if (!Open(file, 8, bytes)) return;
        const int32_t r = Int32At(bytes, 0), c = Int32At(bytes, 4);
        if (r < 0 || c < 0) {
            Problem(file.name + " claims a negative size (" + std::to_string(r) + " x " + std::to_string(c) + ")");
            return;
        }
        m_.scoreRows = r;
        m_.scoreColumns = c;
        file.headerRead = true;
        const uint64_t values = static_cast<uint64_t>(r) * static_cast<uint64_t>(c);
        file.expectedSize = 8 + 4 * values;
        file.contents = std::to_string(r) + " x " + std::to_string(c) + " scores (clusters x styles)";
        if (values > static_cast<uint64_t>(std::numeric_limits<int32_t>::max()))
            Problem(file.name + " is too large for the library (more than 2^31 - 1 scores)");
        CheckSize(file);
        NonFinite(file, CountNonFinite(bytes, 8, file.expectedSize), "scores");
    }

    void Distances() {
        std::vector<char> bytes;
        ModelFile& file = m_.distances;
        if (!Open(file, 4, bytes)) return;
        const int32_t n = Int32At(bytes, 0);
        if (n < 0) {
            Problem(file.name + " claims a negative number of styles (" + std::to_string(n) + ")");
            return;
        }
        m_.distanceCount = n;
        file.headerRead = true;
        const uint64_t values = static_cast<uint64_t>(n) * (static_cast<uint64_t>(n) + 1) / 2;
        file.expectedSize = 4 + 4 * values;
        file.contents = std::to_string(n) + " x " + std::to_string(n) + " distances (upper triangle)";
        CheckSize(file);
        NonFinite(file, CountNonFinite(bytes, 4, file.expectedSize), "distances");
        // The selection relies on a style's distance to itself being 0 so that
        // it does not choose one style twice.
        uint64_t nonZeroDiagonal = 0;
        for (uint64_t i = 0; i < static_cast<uint64_t>(n); ++i) {
            const uint64_t offset = 4 + 4 * (i * n - (i == 0 ? 0 : i * (i - 1) / 2));
            if (offset + 4 <= bytes.size() && FloatAt(bytes, offset) != 0.0f) ++nonZeroDiagonal;
        }
        if (nonZeroDiagonal > 0)
            Remark(file.name + ": " + Plural(static_cast<int64_t>(nonZeroDiagonal), "style has", "styles have") +
                   " a non-zero distance to itself; one style may then be proposed twice");
    }

    void Agreement() {
        if (m_.clusterCount >= 0 && m_.scoreRows >= 0 && m_.scoreRows != m_.clusterCount)
            Problem("the scores file has " + std::to_string(m_.scoreRows) + " rows but there are " +
                    Plural(m_.clusterCount, "cluster", "clusters") +
                    (m_.scoreColumns == m_.clusterCount && m_.scoreRows == m_.styleCount
                         ? " (rows and columns look swapped)"
                         : ""));
        if (m_.styleCount >= 0 && m_.scoreColumns >= 0 && m_.scoreColumns != m_.styleCount)
            Problem("the scores file has " + std::to_string(m_.scoreColumns) + " columns but there are " +
                    Plural(m_.styleCount, "style", "styles"));
        if (m_.styleCount >= 0 && m_.distanceCount >= 0 && m_.distanceCount != m_.styleCount)
            Problem("the distances file is for " + Plural(m_.distanceCount, "style", "styles") + " but there are " +
                    Plural(m_.styleCount, "style", "styles"));
        if (m_.scoreColumns == 1)
            Problem("with a single style the library keeps no style per cluster (it keeps the better half)");
    }

    void Network() {
        for (ModelFile* file : {&m_.definition, &m_.weights}) {
            if (!file->present)
                Problem(file->name + " is missing (the network cannot load)");
            else if (file->size == 0)
                Problem(file->name + " is empty (the network cannot load)");
        }
    }

private:
    ModelExamination& m_;
};

}  // namespace

ModelExamination ExamineModelFiles(const std::string& dir) {
    ModelExamination m;
    m.dir = dir;
    m.clusters = Probe(dir, kClusterFileName);
    m.styles = Probe(dir, kStyleFileName);
    m.scores = Probe(dir, kScoresFileName);
    m.distances = Probe(dir, kDistanceFileName);
    m.definition = Probe(dir, kNetworkDefinitionPath);
    m.weights = Probe(dir, kNetworkWeightsPath);
    std::error_code ec;
    if (!fs::is_directory(dir, ec)) {
        m.problems.push_back(fs::exists(dir, ec) ? "it is not a directory" : "no such directory");
        return m;
    }
    Examiner examiner(m);
    examiner.Clusters();
    examiner.Styles();
    examiner.Scores();
    examiner.Distances();
    examiner.Agreement();
    examiner.Network();
    return m;
}

}  // namespace cli
}  // namespace vora
