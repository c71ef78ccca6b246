// vora-qres-extract: takes the files out of a Qt binary resource archive.
//   vora-qres-extract ARCHIVE                     lists the files with their sizes
//   vora-qres-extract ARCHIVE OUTDIR [--photos]   writes them under OUTDIR
// With --photos only the images that pass the photograph rule of
// modelkit/Photos.h (opaque, shorter side at least 400 px) are written.
// Used by scripts/fetch-photos.sh to reach the photographs of a data package.

#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>
#include <string>

#include <opencv2/imgcodecs.hpp>

#include "modelkit/Photos.h"
#include "modelkit/Qres.h"

namespace fs = std::filesystem;

namespace {

bool IsPhotograph(const std::string& bytes) {
    const cv::Mat encoded(1, static_cast<int>(bytes.size()), CV_8U, const_cast<char*>(bytes.data()));
    cv::Mat image;
    try {
        image = cv::imdecode(encoded, cv::IMREAD_UNCHANGED);
    } catch (const cv::Exception&) {
        return false;
    }
    return vora::modelkit::LooksLikePhotograph(image);
}

}  // namespace

int main(int argc, char** argv) {
    const bool photosOnly = argc == 4 && std::string(argv[3]) == "--photos";
    if (argc < 2 || argc > 4 || (argc == 4 && !photosOnly) || std::string(argv[1]) == "--help") {
        std::fprintf(stderr, "usage: vora-qres-extract ARCHIVE [OUTDIR [--photos]]\n");
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
            if (photosOnly && !IsPhotograph(file.data)) continue;
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
