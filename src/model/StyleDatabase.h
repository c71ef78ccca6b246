#pragma once

#include <string>

namespace vora {

class Engine;

enum class ReadResult { Ok = 0, CannotOpen = -4, SizeMismatch = -5 };

extern const char* const kClusterFileName;   // "semantic_cluster_1000.dat"
extern const char* const kStyleFileName;     // "styledb_style_1500.dat"
extern const char* const kScoresFileName;    // "semantic_style_scores_1000_1500_1.dat"
extern const char* const kDistanceFileName;  // "styledb_fdist_1500.dat"

// Data files are joined as modelDir + "/" + name.
std::string DataFilePath(const std::string& modelDir, const char* name);

void ReadClusterCentres(Engine& engine, const std::string& modelDir);
ReadResult ReadStyleRecords(Engine& engine, const std::string& path);
ReadResult ReadScoresAndDistances(Engine& engine, const std::string& modelDir);

}  // namespace vora
