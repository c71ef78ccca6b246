// The style database readers on one input each, chosen at build time
// (VORA_FUZZ_READER): 1 the cluster file, 2 the style file, 3 the score and
// distance files. The readers report problems through their results and the
// engine's counts, never by exception, so any exception is a finding; so is
// a table that disagrees with its count.
#include <algorithm>
#include <cstddef>
#include <cstdint>

#include "FuzzFiles.h"
#include "model/Engine.h"
#include "model/StyleDatabase.h"

namespace {

void CheckTables(const vora::Engine& engine) {
    if (engine.clusterCount < 0 || static_cast<size_t>(engine.clusterCount) != engine.clusterCentres.size())
        __builtin_trap();
    if (engine.styleCount < 0 || static_cast<size_t>(engine.styleCount) != engine.styleRecords.size())
        __builtin_trap();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    vora::Engine engine;
#if VORA_FUZZ_READER == 1
    vora::fuzz::WriteInput(vora::kClusterFileName, data, size);
    vora::ReadClusterCentres(engine, vora::fuzz::Folder());
    CheckTables(engine);
#elif VORA_FUZZ_READER == 2
    (void)vora::ReadStyleRecords(engine, vora::fuzz::WriteInput(vora::kStyleFileName, data, size));
    CheckTables(engine);
#else
    // Two bytes of counts the earlier files would have given (0 to 63), two
    // of the score file's length, then the score file and the distance file.
    if (size < 4) return 0;
    engine.clusterCount = data[0] % 64;
    engine.styleCount = data[1] % 64;
    engine.clusterCentres.resize(static_cast<size_t>(engine.clusterCount));
    engine.styleRecords.resize(static_cast<size_t>(engine.styleCount));
    const size_t scoreBytes = std::min<size_t>(size - 4, size_t{data[2]} << 8 | data[3]);
    vora::fuzz::WriteInput(vora::kScoresFileName, data + 4, scoreBytes);
    vora::fuzz::WriteInput(vora::kDistanceFileName, data + 4 + scoreBytes, size - 4 - scoreBytes);
    const vora::ReadResult result = vora::ReadScoresAndDistances(engine, vora::fuzz::Folder());
    if (result == vora::ReadResult::Ok) {
        if (engine.rankedStyles.size() != static_cast<size_t>(engine.clusterCount)) __builtin_trap();
        for (const auto& ranked : engine.rankedStyles)
            for (int32_t style : ranked)
                if (style < -1 || style >= engine.styleCount) __builtin_trap();
    }
    CheckTables(engine);
#endif
    return 0;
}
