// vora export-cube: a transfer as a 3D lookup table in the .cube format that
// video and photo tools read.

#include <cmath>
#include <cstdio>
#include <filesystem>
#include <iostream>
#include <string>

#include "vora/Cli.h"
#include "vora/ModelChoice.h"
#include "vora/OutputFiles.h"
#include "vora/Rendering.h"
#include "vora/TransferJson.h"

namespace vora {
namespace cli {
namespace {

// The format allows 256, but such a table is 16.7 million lines (some 450 MB
// of text, built in memory); 129 points, a step of two 8-bit levels, is
// finer than the 17, 33 or 65 that tables are used at.
constexpr long long kMaxSize = 129;

const char* const kSynopsis =
    "export-cube TRANSFERS.json[:K] OUT.cube [--size N] [--strength S] [--model DIR] [--force]";

const char* const kHelp =
    "usage: vora export-cube TRANSFERS.json[:K] OUT.cube [--size N] [--strength S] [--model DIR] [--force]\n"
    "\n"
    "Writes record K (default 0) of a transfers file as a 3D lookup table in the\n"
    ".cube format: N x N x N lattice points over the domain 0..1, red varying\n"
    "fastest. Each point holds the transfer of that colour as the library renders\n"
    "it (the colour taken as 8-bit R, G, B, rounded to the nearest byte), written\n"
    "as byte / 255. Face corrections depend on the place in the picture and are\n"
    "left out: a lookup table knows only colours.\n"
    "\n"
    "  --size N     lattice points per axis, 2 to 129 (default 33)\n"
    "  --strength S how much of the look to use, 0 to 1 (default 1), mixed at each\n"
    "               point exactly as 'vora apply --strength S' mixes a pixel\n"
    "  --model DIR  model directory to open (the library needs one to render);\n"
    "               default: the one recorded in the file, else $VORA_MODEL,\n"
    "               else ./model\n"
    "  --force      replace OUT.cube if it exists\n";

std::string StrengthText(double strength) {
    char text[32];
    std::snprintf(text, sizeof text, "%.17g", strength);
    return text;
}

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("export-cube",
                      {ValueOption("--size"), ValueOption("--model"), FlagOption("--force"), ValueOption("--strength")},
                      args);
    const double strength = StrengthOption(parsed.Value("--strength"));
    parsed.ExpectPositionals(2, 2, kSynopsis);
    const TransferReference reference = ParseTransferReference(parsed.positionals()[0]);
    const std::string outPath = parsed.positionals()[1];
    const bool force = parsed.Flag("--force");
    int size = 33;
    if (auto v = parsed.Value("--size")) size = static_cast<int>(ParseInteger(*v, "--size", 2, kMaxSize));
    if (std::filesystem::path(outPath).extension() != ".cube")
        throw UsageError(outPath + ": the lookup table's name should end in .cube");
    CheckOutputPath(outPath, {reference.path}, force);

    TransferDocument document;
    TRANSFER transfer = LoadTransferRecord(reference, &document);
    const std::string where = reference.path + ":" + std::to_string(reference.index);
    CheckRenderable(transfer, where);
    transfer.faceCorrections.clear();

    const std::string modelDir = ChooseModelDirForRecord(parsed.Value("--model").value_or(""), document.model);
    const auto api = OpenExaminedModel(modelDir);

    // One pixel per lattice point: red along a row, then green, then blue,
    // which is the order the .cube format lists them in.
    const size_t n = static_cast<size_t>(size);
    cv::Mat lattice(static_cast<int>(n * n), static_cast<int>(n), CV_8UC3);
    auto level = [&](size_t i) { return static_cast<uint8_t>(std::lround(255.0 * i / (n - 1))); };
    for (size_t b = 0; b < n; ++b)
        for (size_t g = 0; g < n; ++g) {
            uint8_t* row = lattice.ptr<uint8_t>(static_cast<int>(b * n + g));
            for (size_t r = 0; r < n; ++r) {
                row[3 * r] = level(r);
                row[3 * r + 1] = level(g);
                row[3 * r + 2] = level(b);
            }
        }
    const cv::Mat original = lattice.clone();
    RenderInPlace(*api, lattice, transfer);
    MixWithOriginal(original, lattice, strength);

    std::string text;
    text.reserve(n * n * n * 27 + 512);
    text += "# vora " VORA_VERSION_STRING ": " + where + " (style " + std::to_string(transfer.styleIndex) +
            ", cluster " + std::to_string(transfer.clusterIndex) + "), face corrections left out" +
            (strength < 1.0 ? ", strength " + StrengthText(strength) : std::string()) + "\n";
    text += "# maps sRGB to sRGB: input and output values are sRGB-encoded, as vora reads and writes photos\n";
    text += "# each point is the transfer of its colour rounded to 8 bits; values are bytes / 255\n";
    text += "TITLE \"vora style " + std::to_string(transfer.styleIndex) + "\"\n";
    text += "LUT_3D_SIZE " + std::to_string(size) + "\n";
    text += "DOMAIN_MIN 0.0 0.0 0.0\nDOMAIN_MAX 1.0 1.0 1.0\n";
    char line[64];
    const uint8_t* p = lattice.ptr<uint8_t>(0);
    for (size_t i = 0; i < n * n * n; ++i, p += 3) {
        // Seven decimals tell every byte / 255 apart and read back to the byte.
        std::snprintf(line, sizeof line, "%.7f %.7f %.7f\n", p[0] / 255.0, p[1] / 255.0, p[2] / 255.0);
        text += line;
    }
    WriteFileAtomically(outPath, text, force);
    std::cout << outPath << ": " << size << " x " << size << " x " << size << " lookup table of " << where << "\n";
    return kExitOk;
}

const RegisterCommand kRegistration({"export-cube", "write a saved transfer as a .cube 3D lookup table", kHelp, Run});

}  // namespace
}  // namespace cli
}  // namespace vora
