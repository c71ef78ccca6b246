// vora match: the colours of one style image (or one database style) carried
// onto a photo.

#include <filesystem>
#include <iostream>

#include "vora/Cli.h"
#include "vora/Images.h"
#include "vora/Library.h"
#include "vora/ModelChoice.h"
#include "vora/ModelFiles.h"
#include "vora/OutputFiles.h"
#include "vora/ProgressBar.h"
#include "vora/Rendering.h"
#include "vora/TransferJson.h"

namespace vora {
namespace cli {
namespace {

const char* const kSynopsis = "match CONTENT (STYLE | --style-index N) OUT [options]";

const char* const kHelp =
    "usage: vora match CONTENT STYLE OUT [options]\n"
    "       vora match CONTENT --style-index N OUT [options]\n"
    "\n"
    "Computes one transfer that carries the colours of the image STYLE (any size)\n"
    "onto CONTENT, or those of style N of the model's database, and writes the\n"
    "restyled CONTENT to OUT (format by extension: .jpg, .png, .tif, .webp).\n"
    "A single transfer has no face corrections.\n"
    "\n"
    "  --style-index N  use database style N (0 to the model's style count - 1)\n"
    "                   instead of a style image\n"
    "  --model DIR      model directory (default $VORA_MODEL, else ./model)\n"
    "  --solve F        floor of the photo's colour spread, x 15 (default 1; > 0)\n"
    "  --limit F        lightness move above which it is limited, x 0.2\n"
    "                   (default 1; >= 0)\n"
    "  --json FILE      also save the transfer, for 'vora apply' and 'vora export-cube'\n"
    "  --keep-profile   write OUT in CONTENT's own colour profile (default: sRGB)\n"
    "  --strip-metadata copy no EXIF, XMP or IPTC from CONTENT\n"
    "  --force          replace existing output files, even inputs\n"
    "  --max-pixels N   refuse images above N pixels before decoding them\n"
    "                   (default 128000000)\n";

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("match",
                      {ValueOption("--model"), ValueOption("--solve"), ValueOption("--limit"), ValueOption("--json"),
                       ValueOption("--style-index"), FlagOption("--force"), ValueOption("--max-pixels"),
                       FlagOption("--keep-profile"), FlagOption("--strip-metadata")},
                      args);
    const bool byIndex = parsed.Value("--style-index").has_value();
    parsed.ExpectPositionals(byIndex ? 2 : 3, byIndex ? 2 : 3, kSynopsis);
    const std::string contentPath = parsed.positionals()[0];
    const std::string stylePath = byIndex ? std::string() : parsed.positionals()[1];
    const std::string outPath = parsed.positionals()[byIndex ? 1 : 2];
    const std::string jsonPath = parsed.Value("--json").value_or("");
    const bool force = parsed.Flag("--force");

    VoraParameters params;
    params.numTransfers = 1;
    if (auto v = parsed.Value("--solve")) params.solveFactor = ParseFactor(*v, "--solve", 0.0, true, 100.0);
    if (auto v = parsed.Value("--limit")) params.limitFactor = ParseFactor(*v, "--limit", 0.0, false, 100.0);
    long long styleIndex = -1;
    if (byIndex) styleIndex = ParseInteger(*parsed.Value("--style-index"), "--style-index", 0, INT32_MAX);

    CheckImageExtension(outPath);
    CheckOutputPath(outPath, {contentPath, stylePath}, force);
    if (!jsonPath.empty()) {
        CheckOutputPath(jsonPath, {contentPath, stylePath, outPath}, force);
        if (std::filesystem::path(jsonPath) == std::filesystem::path(outPath))
            throw UsageError(jsonPath + ": given both as OUT and as --json");
    }

    const std::string modelDir = ChooseModelDir(parsed.Value("--model").value_or(""));
    if (byIndex) {
        // The library does not check the index against its database; the
        // style file's header says how many styles there are.
        const ModelExamination model = ExamineModelFiles(modelDir);
        if (model.styleCount < 0)
            throw Failure(modelDir, "cannot tell how many styles the model holds (run 'vora inspect " + modelDir + "')");
        if (styleIndex >= model.styleCount)
            throw UsageError("--style-index: " + std::to_string(styleIndex) + " is out of range (the model has " +
                             std::to_string(model.styleCount) + " styles, numbered 0 to " +
                             std::to_string(model.styleCount - 1) + ")");
    }

    const uint64_t maxPixels = MaxPixelsOption(parsed.Value("--max-pixels"));
    Photo content = ReadPhotoRgb(contentPath, maxPixels);
    cv::Mat contentRgb = PackedRgb(content);  // compute only reads it
    const auto api = OpenExaminedModel(modelDir);
    ImageHandle contentImage = WrapWholeImage(contentRgb);

    TRANSFER transfer;
    if (byIndex) {
        CheckStatus(api->compute_transfer(contentImage.get(), static_cast<int>(styleIndex), transfer, params),
                    contentPath);
    } else {
        Photo style = ReadPhotoRgb(stylePath, maxPixels);
        cv::Mat styleRgb = PackedRgb(style);
        ImageHandle styleImage = WrapWholeImage(styleRgb);
        CheckStatus(api->compute_transfer(contentImage.get(), styleImage.get(), transfer, params), contentPath);
    }
    CheckRenderable(transfer, contentPath);

    ProgressBar bar("match");
    RenderInPlace(*api, content.pixels, transfer, &bar);
    bar.Finish();
    WriteImage(outPath, content.pixels, force, ImageTagsFor(parsed, content));
    std::cout << outPath << ": " << content.pixels.cols << " x " << content.pixels.rows << ", colours of "
              << (byIndex ? "style " + std::to_string(styleIndex) : stylePath) << "\n";

    if (!jsonPath.empty()) {
        TransferDocument document;
        document.model = AbsoluteModelPath(modelDir);
        document.photo = contentPath;
        document.photoWidth = static_cast<uint64_t>(content.pixels.cols);
        document.photoHeight = static_cast<uint64_t>(content.pixels.rows);
        document.style = stylePath;
        document.numTransfers = 1;
        document.rankingFactor = params.rankingFactor;
        document.solveFactor = params.solveFactor;
        document.limitFactor = params.limitFactor;
        document.finishFactor = params.finishFactor;
        document.transfers.push_back(transfer);
        WriteFileAtomically(jsonPath, SerializeTransfers(document), force);
        std::cout << jsonPath << ": the transfer\n";
    }
    return kExitOk;
}

const RegisterCommand kRegistration({"match", "carry the colours of a style image onto a photo", kHelp, Run});

}  // namespace
}  // namespace cli
}  // namespace vora
