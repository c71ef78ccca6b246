// vora inspect: what a model directory holds and what is wrong with it, in
// plain words. The library loads a model silently; this is where a user
// finds out why proposals fail.

#include <cstdio>
#include <iostream>
#include <string>

#include "vora/Cli.h"
#include "vora/ModelChoice.h"
#include "vora/ModelFiles.h"
#include "vora/NetworkCheck.h"

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

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("inspect", {}, args);
    parsed.ExpectPositionals(1, 1, "inspect DIR");
    const std::string dir = parsed.positionals()[0];

    ModelExamination model = ExamineModelFiles(dir);
    std::cout << "model directory: " << AbsoluteModelPath(dir) << "\n";
    for (const ModelFile* file :
         {&model.clusters, &model.styles, &model.scores, &model.distances, &model.definition, &model.weights})
        PrintFile(*file);

    const std::string network = CheckModelNetwork(model);
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
