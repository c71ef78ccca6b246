// vora-descriptor-retrieval: measures how well a model's feature network
// recognises altered copies of photos (see modelkit/Retrieval.h).
//   vora-descriptor-retrieval PHOTO_DIR [--model DIR] [--misses]
// Without --model it first builds a model from PHOTO_DIR (styles and their
// altered copies, as the builder does by default) in a temporary folder and
// reports how long that took.

#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstring>
#include <exception>
#include <filesystem>
#include <string>

#include "modelkit/ModelBuilder.h"
#include "modelkit/Photos.h"
#include "modelkit/Retrieval.h"

namespace fs = std::filesystem;

int main(int argc, char** argv) {
    std::string photoDir, modelDir;
    bool listMisses = false;
    for (int i = 1; i < argc; ++i) {
        const std::string arg = argv[i];
        if (arg == "--model" && i + 1 < argc) {
            modelDir = argv[++i];
        } else if (arg == "--misses") {
            listMisses = true;
        } else if (!arg.empty() && arg[0] != '-' && photoDir.empty()) {
            photoDir = arg;
        } else {
            std::fprintf(stderr, "usage: vora-descriptor-retrieval PHOTO_DIR [--model DIR] [--misses]\n");
            return 2;
        }
    }
    if (photoDir.empty()) {
        std::fprintf(stderr, "usage: vora-descriptor-retrieval PHOTO_DIR [--model DIR] [--misses]\n");
        return 2;
    }

    fs::path temporary;
    try {
        using Clock = std::chrono::steady_clock;
        if (modelDir.empty()) {
            temporary = fs::temp_directory_path() / ("vora-retrieval-" + std::to_string(::getpid()));
            modelDir = temporary.string();
            vora::modelkit::BuildModelOptions options;
            options.stylesDir = photoDir;
            options.outDir = modelDir;
            const auto start = Clock::now();
            vora::modelkit::BuildModel(options);
            std::printf("model built from %s in %.1f s\n", photoDir.c_str(),
                        std::chrono::duration<double>(Clock::now() - start).count());
        }
        const auto start = Clock::now();
        const auto result = vora::modelkit::MeasureRetrieval(modelDir, vora::modelkit::ListPhotos(photoDir));
        if (listMisses)
            for (const std::string& miss : result.misses) std::printf("miss: %s\n", miss.c_str());
        std::printf("retrieval: %d of %d altered copies of %d photos found a copy of their own photo first: %.1f %% (%.1f s)\n",
                    result.found, result.queries, result.photos, 100.0 * result.Rate(),
                    std::chrono::duration<double>(Clock::now() - start).count());
    } catch (const std::exception& e) {
        std::fprintf(stderr, "vora-descriptor-retrieval: %s\n", e.what());
        if (!temporary.empty()) fs::remove_all(temporary);
        return 1;
    }
    if (!temporary.empty()) fs::remove_all(temporary);
    return 0;
}
