#pragma once

// A look at a model directory's files without the library: what each file's
// header promises, whether the file holds that many bytes, whether the files
// agree with each other and whether the tables hold plain numbers. The
// library itself loads silently; this is where a user learns what is wrong.

#include <cstdint>
#include <string>
#include <vector>

namespace vora {
namespace cli {

struct ModelFile {
    std::string name;          // path relative to the model directory, as shown
    std::string path;
    bool present = false;
    uint64_t size = 0;
    bool headerRead = false;   // the counts below were read
    uint64_t expectedSize = 0; // what the header promises (data files only)
    std::string contents;      // "1000 clusters", "1500 styles", ...
};

struct ModelExamination {
    std::string dir;
    ModelFile clusters, styles, scores, distances, definition, weights;
    // Counts from the headers; -1 when not read.
    int64_t clusterCount = -1;   // K, file 1
    int64_t styleCount = -1;     // S, file 2
    int64_t scoreRows = -1;      // R, file 3
    int64_t scoreColumns = -1;   // C, file 3
    int64_t distanceCount = -1;  // N, file 4
    std::vector<std::string> problems;  // each makes the model unusable or its results wrong
    std::vector<std::string> remarks;   // odd but usable

    bool broken() const { return !problems.empty(); }
    // Styles the library keeps per cluster (the better half of the scores' columns).
    int64_t stylesPerCluster() const { return scoreColumns >= 0 ? scoreColumns / 2 : -1; }
};

ModelExamination ExamineModelFiles(const std::string& dir);

}  // namespace cli
}  // namespace vora
