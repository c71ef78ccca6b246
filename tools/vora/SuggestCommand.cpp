// vora suggest: the library's proposals for a photo, rendered, with a contact
// sheet to choose from and the transfers saved for later use.

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <iostream>

#include "vora/Cli.h"
#include "vora/ContactSheet.h"
#include "vora/FaceDetection.h"
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

namespace fs = std::filesystem;

constexpr long long kMaxProposals = 100;
constexpr int kThumbnailSide = 420;
// Proposals are for choosing a look; full resolution is what apply is for.
constexpr int kDefaultPreviewSide = 2048;

const char* const kSynopsis = "suggest PHOTO [options]";

const char* const kHelp =
    "usage: vora suggest PHOTO [options]\n"
    "\n"
    "Asks the library for N proposals of colour treatments for PHOTO, renders\n"
    "each on a preview (the photo scaled to a long side of 2048 pixels) and\n"
    "writes, in the output folder:\n"
    "  STEM-K.EXT          proposal K (0 to N-1), K being its record in transfers.json\n"
    "  contact-sheet.png   the original and every proposal, labelled with style and\n"
    "                      cluster, faces outlined\n"
    "  transfers.json      the transfers, for 'vora apply' and 'vora export-cube'\n"
    "\n"
    "  -n N                 number of proposals, 1 to 100, at most the styles the\n"
    "                       model keeps per scene (default 5)\n"
    "  --model DIR          model directory (default $VORA_MODEL, else ./model)\n"
    "  --faces auto         detect faces (the default)\n"
    "  --faces none         no face correction\n"
    "  --faces L,R,T,B      a face, normalised 0..1 (0 <= L < R <= 1, 0 <= T < B <= 1,\n"
    "                       y downward); repeat for several faces\n"
    "  --detector hog|haar  detector for --faces auto (default hog when built with dlib)\n"
    "  --out DIR            output folder (default ./STEM-vora; made if missing)\n"
    "  --format EXT         proposals' format: jpg, png, tif or webp (default: the\n"
    "                       photo's own, else png)\n"
    "  --ranking F          minimum difference between proposals, x 15 (default 1; >= 0)\n"
    "  --solve F            floor of the photo's colour spread, x 15 (default 1; > 0)\n"
    "  --limit F            lightness move above which it is limited, x 0.2 (default 1; >= 0)\n"
    "  --finish F           lightness faces are lifted toward, x 0.5 (default 1; 0 to 2)\n"
    "  --preview N          long side of the previews in pixels, 16 to 65536\n"
    "                       (default 2048); the transfers are computed on the\n"
    "                       whole photo either way\n"
    "  --full               render the proposals at full resolution instead\n"
    "  --strength S         how much of each look to show, 0 to 1 (default 1)\n"
    "  --keep-profile       write the proposals in the photo's own colour profile\n"
    "                       (default: sRGB)\n"
    "  --strip-metadata     copy no EXIF, XMP or IPTC from the photo\n"
    "  --force              replace files that exist in the output folder\n"
    "  --max-pixels N       refuse photos above N pixels before decoding them\n"
    "                       (default 128000000)\n";

// STEM-K.EXT with K a number and EXT an image format we write: a proposal.
bool IsProposalName(const std::string& name, const std::string& stem) {
    if (name.size() <= stem.size() + 1 || name.compare(0, stem.size() + 1, stem + "-") != 0) return false;
    const size_t dot = name.rfind('.');
    if (dot == std::string::npos || dot <= stem.size() + 1) return false;
    for (size_t i = stem.size() + 1; i < dot; ++i)
        if (!std::isdigit(static_cast<unsigned char>(name[i]))) return false;
    std::string ext = name.substr(dot + 1);
    std::transform(ext.begin(), ext.end(), ext.begin(), [](unsigned char c) { return std::tolower(c); });
    return ext == "jpg" || ext == "jpeg" || ext == "png" || ext == "tif" || ext == "tiff" || ext == "webp";
}

std::string Lower(std::string s) {
    std::transform(s.begin(), s.end(), s.begin(), [](unsigned char c) { return std::tolower(c); });
    return s;
}

std::string ChooseFormat(const std::string& given, const std::string& photoPath) {
    static const char* const kFormats[] = {"jpg", "jpeg", "png", "tif", "tiff", "webp"};
    if (!given.empty()) {
        const std::string ext = Lower(given[0] == '.' ? given.substr(1) : given);
        for (const char* f : kFormats)
            if (ext == f) return ext;
        throw UsageError("--format: '" + given + "' is not jpg, png, tif or webp");
    }
    std::string ext = Lower(fs::path(photoPath).extension().string());
    if (!ext.empty()) ext.erase(0, 1);
    for (const char* f : kFormats)
        if (ext == f) return ext;
    return "png";
}

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("suggest",
                      {ValueOption("-n"), ValueOption("--model"), RepeatedOption("--faces"), ValueOption("--detector"),
                       ValueOption("--out"), ValueOption("--format"), ValueOption("--ranking"), ValueOption("--solve"),
                       ValueOption("--limit"), ValueOption("--finish"), FlagOption("--force"),
                       ValueOption("--max-pixels"), ValueOption("--preview"), FlagOption("--full"),
                       ValueOption("--strength"), FlagOption("--keep-profile"), FlagOption("--strip-metadata")},
                      args);
    parsed.ExpectPositionals(1, 1, kSynopsis);
    const std::string photoPath = parsed.positionals()[0];
    const bool force = parsed.Flag("--force");

    // Parameters, checked before anything is read.
    VoraParameters params;
    if (auto v = parsed.Value("-n")) params.numTransfers = static_cast<uint64_t>(ParseInteger(*v, "-n", 1, kMaxProposals));
    if (auto v = parsed.Value("--ranking")) params.rankingFactor = ParseFactor(*v, "--ranking", 0.0, false, 100.0);
    if (auto v = parsed.Value("--solve")) params.solveFactor = ParseFactor(*v, "--solve", 0.0, true, 100.0);
    if (auto v = parsed.Value("--limit")) params.limitFactor = ParseFactor(*v, "--limit", 0.0, false, 100.0);
    if (auto v = parsed.Value("--finish")) params.finishFactor = ParseFactor(*v, "--finish", 0.0, false, 2.0);
    const FaceRequest faceRequest = ParseFaceRequest(parsed.Values("--faces"));
    FaceDetector detector = DefaultFaceDetector();
    if (auto d = parsed.Value("--detector")) {
        detector = ParseFaceDetector(*d);
        if (faceRequest.kind != FaceRequest::Auto) throw UsageError("--detector: only used with --faces auto");
    }
    if (parsed.Flag("--full") && parsed.Value("--preview"))
        throw UsageError("--full and --preview: choose one (--full renders at full resolution)");
    const int previewSide = parsed.Flag("--full") ? 0
                            : parsed.Value("--preview")
                                ? static_cast<int>(ParseInteger(*parsed.Value("--preview"), "--preview", 16, 65536))
                                : kDefaultPreviewSide;
    const double strength = StrengthOption(parsed.Value("--strength"));
    const std::string format = ChooseFormat(parsed.Value("--format").value_or(""), photoPath);

    // Outputs: every file is checked before any work.
    const std::string stem = fs::path(photoPath).stem().string();
    const fs::path outDir = parsed.Value("--out").value_or(stem + "-vora");
    std::error_code ec;
    if (fs::exists(outDir, ec) && !fs::is_directory(outDir, ec))
        throw UsageError(outDir.string() + ": exists and is not a folder (--out names a folder)");
    std::vector<std::string> proposalPaths;
    for (uint64_t k = 0; k < params.numTransfers; ++k)
        proposalPaths.push_back((outDir / (stem + "-" + std::to_string(k) + "." + format)).string());
    const std::string sheetPath = (outDir / "contact-sheet.png").string();
    const std::string jsonPath = (outDir / "transfers.json").string();
    if (fs::is_directory(outDir, ec)) {
        // Proposals of an earlier run in another format or number would sit
        // beside the new set and no longer match its transfers.json.
        if (!force) {
            for (const auto& entry : fs::directory_iterator(outDir, ec)) {
                const std::string name = entry.path().filename().string();
                if (IsProposalName(name, stem))
                    throw UsageError((outDir / name).string() +
                                     ": a proposal of an earlier run is in the output folder; refusing to mix the "
                                     "sets (use --force, or another --out)");
            }
        }
        for (const std::string& path : proposalPaths) CheckOutputPath(path, {photoPath}, force);
        CheckOutputPath(sheetPath, {photoPath}, force);
        CheckOutputPath(jsonPath, {photoPath}, force);
    }

    // The model: its files are examined first, because the library loads
    // silently and would only say "incomplete" later.
    const std::string modelDir = ChooseModelDir(parsed.Value("--model").value_or(""));
    RequireModelDirectory(modelDir);
    const ModelExamination model = ExamineModelFiles(modelDir);
    if (model.broken())
        throw Failure(modelDir, "the model is broken: " + model.problems.front() + " (run 'vora inspect " + modelDir +
                                    "' for the full report)");
    if (static_cast<int64_t>(params.numTransfers) > model.stylesPerCluster())
        throw UsageError("-n: " + std::to_string(params.numTransfers) + " is more than the " +
                         std::to_string(model.stylesPerCluster()) +
                         " styles this model keeps per scene; proposals would repeat");

    Photo photo = ReadPhotoRgb(photoPath, MaxPixelsOption(parsed.Value("--max-pixels")));
    cv::Mat rgb = PackedRgb(photo);  // compute reads packed R, G, B only

    TransferDocument document;
    document.model = AbsoluteModelPath(modelDir);
    document.photo = photoPath;
    document.photoWidth = static_cast<uint64_t>(photo.pixels.cols);
    document.photoHeight = static_cast<uint64_t>(photo.pixels.rows);
    document.numTransfers = params.numTransfers;
    document.rankingFactor = params.rankingFactor;
    document.solveFactor = params.solveFactor;
    document.limitFactor = params.limitFactor;
    document.finishFactor = params.finishFactor;
    std::string faceNote;
    switch (faceRequest.kind) {
    case FaceRequest::Auto:
        for (const DetectedFace& face : DetectFaces(rgb, detector)) document.faces.push_back(face.box);
        document.faceSource = "auto";
        faceNote = std::to_string(document.faces.size()) + (document.faces.size() == 1 ? " face" : " faces") +
                   " found (" + FaceDetectorName(detector) + ")";
        break;
    case FaceRequest::Given:
        document.faces = faceRequest.boxes;
        document.faceSource = "given";
        faceNote = std::to_string(document.faces.size()) + (document.faces.size() == 1 ? " face" : " faces") + " given";
        break;
    case FaceRequest::None:
        document.faceSource = "none";
        faceNote = "no face correction";
        break;
    }
    std::vector<CFaceRect> faceRects;
    for (const FaceBox& f : document.faces) faceRects.emplace_back(f.left, f.right, f.top, f.bottom);
    params.faceRects = faceRects.empty() ? nullptr : faceRects.data();
    params.numFaceRects = static_cast<uint32_t>(faceRects.size());

    const auto api = OpenModel(modelDir);
    ImageHandle image = WrapWholeImage(rgb);
    document.transfers.resize(params.numTransfers);
    CheckStatus(api->compute_transfers(image.get(), document.transfers, params), photoPath);
    image.reset();
    for (size_t k = 0; k < document.transfers.size(); ++k)
        CheckRenderable(document.transfers[k], photoPath + ": proposal " + std::to_string(k));

    std::cout << photoPath << ": " << photo.pixels.cols << " x " << photo.pixels.rows << ", " << faceNote << "\n";
    // The set is written into a staging folder and moved into place at the
    // end: a failure midway (a full disk) or an interrupt leaves nothing, so
    // the command can simply be run again.
    StagingFolder staging(outDir.string());
    const auto staged = [&staging](const std::string& path) {
        return staging.PathFor(fs::path(path).filename().string());
    };

    // Face corrections and tiles are placed in normalised coordinates, so a
    // transfer renders a scaled copy as it renders the photo.
    const cv::Mat shown = previewSide > 0 ? ScaledToLongSide(photo.pixels, previewSide) : photo.pixels;
    if (shown.cols != photo.pixels.cols)
        std::cout << "previews: " << shown.cols << " x " << shown.rows << " (--full for full resolution)\n";
    std::vector<SheetEntry> sheet;
    sheet.push_back({MakeThumbnail(shown, kThumbnailSide), "original", stem});
    ProgressBar bar("suggest");
    const double share = 1.0 / static_cast<double>(document.transfers.size());
    for (size_t k = 0; k < document.transfers.size(); ++k) {
        const TRANSFER& t = document.transfers[k];
        cv::Mat rendered = shown.clone();
        RenderInPlace(*api, rendered, t, &bar, share * k, share * (k + 1));
        MixWithOriginal(shown, rendered, strength);
        WriteImage(staged(proposalPaths[k]), rendered, false, ImageTagsFor(parsed, photo));
        sheet.push_back({MakeThumbnail(rendered, kThumbnailSide),
                         "#" + std::to_string(k) + "  style " + std::to_string(t.styleIndex),
                         "cluster " + std::to_string(t.clusterIndex) +
                             (t.faceCorrections.empty()
                                  ? std::string()
                                  : ", " + std::to_string(t.faceCorrections.size()) + " face(s) lifted")});
    }
    bar.Finish();

    const std::string heading = fs::path(photoPath).filename().string() + "  |  " + faceNote + "  |  model " + modelDir;
    WriteImage(staged(sheetPath), ComposeContactSheet(heading, sheet, document.faces), false);
    WriteFileAtomically(staged(jsonPath), SerializeTransfers(document), false);
    staging.Commit(force);
    for (size_t k = 0; k < document.transfers.size(); ++k)
        std::cout << "  " << k << "  style " << document.transfers[k].styleIndex << "  cluster "
                  << document.transfers[k].clusterIndex << "  " << proposalPaths[k] << "\n";
    std::cout << "contact sheet: " << sheetPath << "\ntransfers: " << jsonPath << "\n";
    return kExitOk;
}

const RegisterCommand kRegistration({"suggest", "propose and render colour treatments for a photo", kHelp, Run});

}  // namespace
}  // namespace cli
}  // namespace vora
