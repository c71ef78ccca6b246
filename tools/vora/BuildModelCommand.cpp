// vora build-model: a model directory from a folder of style photographs.

#include <filesystem>
#include <iostream>
#include <new>
#include <stdexcept>

#include "modelkit/ModelBuilder.h"
#include "vora/Cli.h"
#include "vora/Library.h"
#include "vora/ModelFiles.h"

namespace vora {
namespace cli {
namespace {

namespace fs = std::filesystem;

const char* const kSynopsis = "build-model --styles DIR [--content DIR] [--clusters K] --out DIR [--force]";

const char* const kHelp =
    "usage: vora build-model --styles DIR [--content DIR] [--clusters K] --out DIR [--force]\n"
    "\n"
    "Builds a model directory from photographs: every photo in --styles becomes a\n"
    "style (its colour statistics), the scenes are grouped into K clusters with a\n"
    "fixed scene descriptor network, and each cluster ranks the styles. The same\n"
    "photos give the same bytes.\n"
    "\n"
    "  --styles DIR    folder of style photographs (JPEG, PNG, TIFF, WebP)\n"
    "  --content DIR   folder of photographs whose scenes define the clusters\n"
    "                  (default: the style photos and altered copies of them)\n"
    "  --clusters K    number of clusters, 1 to 1000 (default: from the number\n"
    "                  of photos)\n"
    "  --out DIR       model directory to write (made if missing)\n"
    "  --force         replace a model that is already in --out\n";

// The six files a model consists of, relative to its directory.
const char* const kModelFiles[] = {"semantic_cluster_1000.dat", "styledb_style_1500.dat",
                                   "semantic_style_scores_1000_1500_1.dat", "styledb_fdist_1500.dat",
                                   "net/deploy2.prototxt", "net/caffe_reduce_512_model"};

void RequireFolder(const std::string& dir, const std::string& option) {
    std::error_code ec;
    if (!fs::exists(dir, ec)) throw Failure(dir, "no such folder (" + option + ")");
    if (!fs::is_directory(dir, ec)) throw Failure(dir, "is not a folder (" + option + ")");
}

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("build-model",
                      {ValueOption("--styles"), ValueOption("--content"), ValueOption("--clusters"),
                       ValueOption("--out"), FlagOption("--force")},
                      args);
    parsed.ExpectPositionals(0, 0, kSynopsis);
    const auto styles = parsed.Value("--styles");
    const auto outValue = parsed.Value("--out");
    if (!styles) throw UsageError("build-model: --styles DIR is required; usage: vora " + std::string(kSynopsis));
    if (!outValue) throw UsageError("build-model: --out DIR is required; usage: vora " + std::string(kSynopsis));
    const bool force = parsed.Flag("--force");

    modelkit::BuildModelOptions options;
    options.stylesDir = *styles;
    options.contentDir = parsed.Value("--content").value_or("");
    if (auto k = parsed.Value("--clusters")) options.clusters = static_cast<int>(ParseInteger(*k, "--clusters", 1, 1000));

    // "my-model/" and "my-model" name the same folder; messages use the latter.
    fs::path out = fs::path(*outValue).lexically_normal();
    if (out.filename().empty()) out = out.parent_path();
    std::error_code ec;
    if (fs::exists(out, ec) && !fs::is_directory(out, ec))
        throw UsageError(out.string() + ": exists and is not a folder (--out names the model directory)");
    if (fs::is_directory(out, ec) && !force)
        for (const char* name : kModelFiles)
            if (fs::exists(out / name, ec))
                throw UsageError(out.string() + ": already holds a model (" + name + "); use --force to replace it");
    RequireFolder(options.stylesDir, "--styles");
    if (!options.contentDir.empty()) RequireFolder(options.contentDir, "--content");
    fs::path parent = out.parent_path();
    if (parent.empty()) parent = ".";
    if (!fs::is_directory(parent, ec)) throw Failure(out.string(), "its folder " + parent.string() + " does not exist");

    // The builder writes into a staging folder inside out and renames the
    // files into place once all are complete; if it fails, a folder that
    // this command made is removed again.
    const bool outExisted = fs::exists(out, ec);
    ProgressBar bar("build-model");
    options.outDir = out.string();
    options.progress = [&bar](double fraction, const std::string& what) { bar.Update(fraction, what); };
    try {
        modelkit::BuildModel(options);
    } catch (const std::exception& e) {
        if (!outExisted && fs::is_directory(out, ec) && fs::is_empty(out, ec)) fs::remove(out, ec);
        if (dynamic_cast<const std::bad_alloc*>(&e)) throw;
        throw Failure(std::string("build-model: ") + e.what());
    }
    bar.Finish();

    // The result must pass the same checks as 'vora inspect'.
    ModelExamination check = ExamineModelFiles(out.string());
    CheckModelNetwork(check);
    if (check.broken()) throw Failure(out.string(), "the built model is broken: " + check.problems.front());
    std::cout << out.string() << ": " << check.clusterCount << " clusters, " << check.styleCount << " styles\n";
    return kExitOk;
}

const RegisterCommand kRegistration({"build-model", "build a model directory from style photographs", kHelp, Run});

}  // namespace
}  // namespace cli
}  // namespace vora
