#pragma once

#include <string>

#include "KitApi.h"
#include "model/ModelFileNames.h"

namespace vora {

struct Engine;

enum class ReadResult { Ok = 0, CannotOpen = -4, SizeMismatch = -5 };

// Data files are joined as modelDir + "/" + name (so "./model/" gives
// "./model//name", which file systems accept).
std::string DataFilePath(const std::string& modelDir, const char* name);

// The readers take every count from the file's own header. Tables are
// zero-filled before reading and reads are not checked, so a file shorter than
// its header promises leaves a zero tail without an error. That tail may be as
// large as the file itself or 16 MiB, whichever is larger; a count that needs
// more is refused before anything is allocated (the cluster file as an empty
// table with count 0, the style file as SizeMismatch with count 0, the scores
// and distance files as SizeMismatch), so memory follows the file, not what its
// header claims. A header of fewer than 4 bytes reads as 0, as an empty file
// does. A negative count in the cluster or style file is read as 0 (empty
// table, count 0).

// Cluster centres and count. A missing file leaves both untouched.
void ReadClusterCentres(Engine& engine, const std::string& modelDir);

// Style records and count from the file at path; CannotOpen leaves both untouched.
ReadResult ReadStyleRecords(Engine& engine, const std::string& path);

// Scores, then distances; needs the cluster and style counts already read.
// The score column count is stored even when the file is then rejected.
// SizeMismatch when the score rows differ from the cluster count or the
// columns from the style count (also when the counts are negative or their
// product leaves the int32 range: nothing else is stored, the distances are
// not read), or when the distance count differs from the style count (the
// ranking stays, the distance table is untouched). Each cluster keeps the
// better half of its styles, C / 2, by decreasing score; the rest hold -1.
ReadResult ReadScoresAndDistances(Engine& engine, const std::string& modelDir);

}  // namespace vora
