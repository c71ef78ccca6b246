// vora inspect: what a model directory holds and what is wrong with it, in
// plain words. The library loads a model silently; this is where a user
// finds out why proposals fail.

#include <cstdio>
#include <iostream>
#include <string>

#include "vora/Cli.h"
#include "vora/Library.h"
#include "vora/ModelFiles.h"

namespace vora {
namespace cli {
namespace {

const char* const kHelp =
    "usage: vora inspect DIR\n"
    "\n"
    "Reports what the model directory DIR holds: each file's size against what\n"
    "its header promises, the counts of clusters and styles and whether the files\n"
    "agree on them, whether the tables hold plain numbers, and whether the\n"
    "network loads and turns a test picture into a feature the library can use.\n"
    "Exit status 0 when the model is usable, 1 when it is broken.\n";

std::string Bytes(uint64_t n) {
    std::string digits = std::to_string(n), out;
    for (size_t i = 0; i < digits.size(); ++i) {
        if (i > 0 && (digits.size() - i) % 3 == 0) out += ',';
        out += digits[i];
    }
    return out;
}

void PrintFile(const ModelFile& file) {
    char line[512];
    if (!file.present) {
        std::snprintf(line, sizeof line, "  %-40s %s\n", file.name.c_str(), "missing");
    } else {
        std::string note = file.contents;
        if (file.headerRead && file.size != file.expectedSize)
            note += " (header promises " + Bytes(file.expectedSize) + " bytes)";
        std::snprintf(line, sizeof line, "  %-40s %14s bytes  %s\n", file.name.c_str(), Bytes(file.size).c_str(),
                      note.c_str());
    }
    std::cout << line;
}

// A small picture with some of everything (gradients, a face-sized blob of
// skin tone) for the network and the ranking to work on.
cv::Mat TestPicture() {
    cv::Mat rgb(96, 128, CV_8UC3);
    for (int y = 0; y < rgb.rows; ++y)
        for (int x = 0; x < rgb.cols; ++x) {
            uint8_t* p = rgb.ptr<uint8_t>(y) + 3 * x;
            p[0] = static_cast<uint8_t>(40 + 2 * x % 200);
            p[1] = static_cast<uint8_t>(60 + (x + y) % 150);
            p[2] = static_cast<uint8_t>(200 - y);
        }
    return rgb;
}

// Loads the network through the library, as any host would, and runs one
// computation. Adds problems to the examination; returns a line for the report.
std::string CheckNetwork(ModelExamination& model) {
    if (!model.definition.present || !model.weights.present) return "network: not loaded (files missing)";
    std::unique_ptr<vora_api> api;
    try {
        api = std::make_unique<vora_api>(WithTrailingSlash(model.dir));
    } catch (const cv::Exception& e) {
        model.problems.push_back("the network does not load: " + e.err);
        return "network: does not load";
    } catch (const std::exception& e) {
        model.problems.push_back(std::string("the network does not load: ") + e.what());
        return "network: does not load";
    }
    if (model.broken()) return "network: loads (no test computation: the data files are broken)";

    cv::Mat rgb = TestPicture();
    ImageHandle image = WrapWholeImage(rgb);
    VoraParameters params;
    params.numTransfers = 1;
    std::vector<TRANSFER> out(1);
    Status status;
    try {
        status = api->compute_transfers(image.get(), out, params);
    } catch (const cv::Exception& e) {
        model.problems.push_back("the network fails on a test picture: " + e.err);
        return "network: loads, but fails on a test picture";
    } catch (const std::exception& e) {
        model.problems.push_back(std::string("the network fails on a test picture: ") + e.what());
        return "network: loads, but fails on a test picture";
    }
    if (status == STATUS_MODEL_INCOMPLETE) {
        // The data files were found complete and in agreement above, so the
        // library's "incomplete" can only mean a short feature.
        model.problems.push_back("the network does not give the 512 values the library needs");
        return "network: loads, but its feature is too short";
    }
    if (status != STATUS_OK) {
        model.problems.push_back("a test computation fails: " + StatusText(status));
        return "network: loads, but a test computation fails";
    }
    return "network: loads and gives 512 values; a test picture was matched to cluster " +
           std::to_string(out[0].clusterIndex) + " and given style " + std::to_string(out[0].styleIndex);
}

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("inspect", {}, args);
    parsed.ExpectPositionals(1, 1, "inspect DIR");
    const std::string dir = parsed.positionals()[0];

    ModelExamination model = ExamineModelFiles(dir);
    std::cout << "model directory: " << AbsoluteModelPath(dir) << "\n";
    for (const ModelFile* file :
         {&model.clusters, &model.styles, &model.scores, &model.distances, &model.definition, &model.weights})
        PrintFile(*file);

    const std::string network = CheckNetwork(model);
    std::cout << network << "\n";
    if (model.stylesPerCluster() > 0 && !model.broken())
        std::cout << "ranking: each of the " << model.clusterCount << " clusters offers its best "
                  << model.stylesPerCluster() << " of " << model.styleCount << " styles (at most -n "
                  << model.stylesPerCluster() << ")\n";
    for (const std::string& remark : model.remarks) std::cout << "note: " << remark << "\n";
    if (model.broken()) {
        std::cout << "problems:\n";
        for (const std::string& problem : model.problems) std::cout << "  - " << problem << "\n";
        std::cout << "result: broken (" << model.problems.size()
                  << (model.problems.size() == 1 ? " problem" : " problems") << ")\n";
        PrintError(dir + ": the model is broken: " + model.problems.front());
        return kExitFailure;
    }
    std::cout << "result: usable\n";
    return kExitOk;
}

const RegisterCommand kRegistration({"inspect", "check a model directory and say what is wrong", kHelp, Run});

}  // namespace
}  // namespace cli
}  // namespace vora
