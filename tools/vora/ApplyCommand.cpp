// vora apply: one saved transfer rendered onto a photo at full resolution.

#include <cmath>
#include <iostream>

#include "vora/Cli.h"
#include "vora/Images.h"
#include "vora/Library.h"
#include "vora/OutputFiles.h"
#include "vora/TransferJson.h"

namespace vora {
namespace cli {
namespace {

const char* const kSynopsis = "apply PHOTO TRANSFERS.json[:K] OUT [options]";

const char* const kHelp =
    "usage: vora apply PHOTO TRANSFERS.json[:K] OUT [options]\n"
    "\n"
    "Renders record K (default 0) of a transfers file onto PHOTO at full\n"
    "resolution, tile by tile, and writes OUT in the format its extension names\n"
    "(.jpg, .png, .tif, .webp). PHOTO may be any size; it need not be the photo\n"
    "the transfer was computed for (face corrections are placed by their\n"
    "normalised position). An alpha channel passes through untouched.\n"
    "\n"
    "  --strength S how much of the look to use, 0 to 1 (default 1): each colour\n"
    "               byte becomes o + S x (restyled - o), rounded to nearest\n"
    "  --model DIR  model directory to open (the library needs one to render);\n"
    "               default: the one recorded in the file, else $VORA_MODEL,\n"
    "               else ./model\n"
    "  --keep-profile  write OUT in PHOTO's own colour profile (default: sRGB)\n"
    "  --strip-metadata  copy no EXIF, XMP or IPTC from PHOTO\n"
    "  --force      replace OUT if it exists, even if it is an input\n"
    "  --max-pixels N  refuse photos above N pixels before decoding them\n"
    "               (default 128000000)\n";

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("apply",
                      {ValueOption("--model"), FlagOption("--force"), ValueOption("--max-pixels"),
                       ValueOption("--strength"), FlagOption("--keep-profile"), FlagOption("--strip-metadata")},
                      args);
    parsed.ExpectPositionals(3, 3, kSynopsis);
    const std::string photoPath = parsed.positionals()[0];
    const TransferReference reference = ParseTransferReference(parsed.positionals()[1]);
    const std::string outPath = parsed.positionals()[2];
    const bool force = parsed.Flag("--force");
    const double strength = StrengthOption(parsed.Value("--strength"));

    CheckImageExtension(outPath);
    CheckOutputPath(outPath, {photoPath, reference.path}, force);

    TransferDocument document;
    const TRANSFER transfer = LoadTransferRecord(reference, &document);
    const std::string where = reference.path + ":" + std::to_string(reference.index);
    CheckRenderable(transfer, where);

    Photo photo = ReadPhoto(photoPath, MaxPixelsOption(parsed.Value("--max-pixels")));

    const std::string modelDir = ChooseModelDirForRecord(parsed.Value("--model").value_or(""), document.model);
    const auto api = OpenExaminedModel(modelDir);

    // Face corrections sit at normalised positions: on a photo of other
    // proportions they land on other parts of the picture.
    if (!transfer.faceCorrections.empty() && document.photoWidth > 0 && document.photoHeight > 0) {
        const double was = static_cast<double>(document.photoWidth) / static_cast<double>(document.photoHeight);
        const double now = static_cast<double>(photo.pixels.cols) / photo.pixels.rows;
        if (std::fabs(std::log(now / was)) > 0.02)
            PrintNotice(photoPath + ": proportions differ from the photo the transfer was computed for; its face "
                                    "corrections may be misplaced");
    }

    // The original is kept only when it is mixed back in.
    const cv::Mat original = strength < 1.0 ? photo.pixels.clone() : cv::Mat();
    ProgressBar bar("apply");
    RenderInPlace(*api, photo.pixels, transfer, &bar);
    bar.Finish();
    MixWithOriginal(original, photo.pixels, strength);
    WriteImage(outPath, photo.pixels, force, ImageTagsFor(parsed, photo));
    std::cout << outPath << ": " << photo.pixels.cols << " x " << photo.pixels.rows << ", " << where << " (style "
              << transfer.styleIndex << ", cluster " << transfer.clusterIndex << ")\n";
    return kExitOk;
}

const RegisterCommand kRegistration({"apply", "render a saved transfer onto a photo at full resolution", kHelp, Run});

}  // namespace
}  // namespace cli
}  // namespace vora
