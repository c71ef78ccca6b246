// vora suggest: the library's proposals for a photo, rendered, with a contact
// sheet to choose from and the transfers saved for later use.

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <iostream>
#include <optional>
#include <string>
#include <vector>

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

// What the command line asks for, checked before anything is read.
struct SuggestRequest {
    std::string photoPath;
    bool force = false;
    VoraParameters params;
    FaceRequest faces;
    FaceDetector detector = DefaultFaceDetector();
    int previewSide = kDefaultPreviewSide;  // 0: full resolution
    double strength = 1.0;
    std::string format;
    std::string modelDir;
};

SuggestRequest ParseRequest(const ParsedArgs& parsed) {
    parsed.ExpectPositionals(1, 1, kSynopsis);
    SuggestRequest request;
    request.photoPath = parsed.positionals()[0];
    request.force = parsed.Flag("--force");
    VoraParameters& params = request.params;
    if (auto v = parsed.Value("-n")) params.numTransfers = static_cast<uint64_t>(ParseInteger(*v, "-n", 1, kMaxProposals));
    if (auto v = parsed.Value("--ranking")) params.rankingFactor = ParseFactor(*v, "--ranking", 0.0, false, 100.0);
    if (auto v = parsed.Value("--solve")) params.solveFactor = ParseFactor(*v, "--solve", 0.0, true, 100.0);
    if (auto v = parsed.Value("--limit")) params.limitFactor = ParseFactor(*v, "--limit", 0.0, false, 100.0);
    if (auto v = parsed.Value("--finish")) params.finishFactor = ParseFactor(*v, "--finish", 0.0, false, 2.0);
    request.faces = ParseFaceRequest(parsed.Values("--faces"));
    if (auto d = parsed.Value("--detector")) {
        request.detector = ParseFaceDetector(*d);
        if (request.faces.kind != FaceRequest::Auto) throw UsageError("--detector: only used with --faces auto");
    }
    if (parsed.Flag("--full") && parsed.Value("--preview"))
        throw UsageError("--full and --preview: choose one (--full renders at full resolution)");
    if (parsed.Flag("--full"))
        request.previewSide = 0;
    else if (auto v = parsed.Value("--preview"))
        request.previewSide = static_cast<int>(ParseInteger(*v, "--preview", 16, 65536));
    request.strength = StrengthOption(parsed.Value("--strength"));
    request.format = ChooseFormat(parsed.Value("--format").value_or(""), request.photoPath);
    request.modelDir = ChooseModelDir(parsed.Value("--model").value_or(""));
    return request;
}

// The files a run writes.
struct SuggestOutputs {
    std::string stem;
    fs::path folder;
    std::vector<std::string> proposals;
    std::string sheet;
    std::string transfers;
};

// Names every output and checks each before any work. Proposals of an
// earlier run in another format or number would sit beside the new set and
// no longer match its transfers.json, so they are refused unless --force.
SuggestOutputs PlanOutputs(const SuggestRequest& request, const std::optional<std::string>& out) {
    SuggestOutputs outputs;
    outputs.stem = fs::path(request.photoPath).stem().string();
    outputs.folder = out.value_or(outputs.stem + "-vora");
    std::error_code ec;
    if (fs::exists(outputs.folder, ec) && !fs::is_directory(outputs.folder, ec))
        throw UsageError(outputs.folder.string() + ": exists and is not a folder (--out names a folder)");
    for (uint64_t k = 0; k < request.params.numTransfers; ++k)
        outputs.proposals.push_back(
            (outputs.folder / (outputs.stem + "-" + std::to_string(k) + "." + request.format)).string());
    outputs.sheet = (outputs.folder / "contact-sheet.png").string();
    outputs.transfers = (outputs.folder / "transfers.json").string();
    if (!fs::is_directory(outputs.folder, ec)) return outputs;
    if (!request.force) {
        for (const auto& entry : fs::directory_iterator(outputs.folder, ec)) {
            const std::string name = entry.path().filename().string();
            if (IsProposalName(name, outputs.stem))
                throw UsageError((outputs.folder / name).string() +
                                 ": a proposal of an earlier run is in the output folder; refusing to mix the "
                                 "sets (use --force, or another --out)");
        }
    }
    for (const std::string& path : outputs.proposals) CheckOutputPath(path, {request.photoPath}, request.force);
    CheckOutputPath(outputs.sheet, {request.photoPath}, request.force);
    CheckOutputPath(outputs.transfers, {request.photoPath}, request.force);
    return outputs;
}

// The model's files are examined first, because the library loads silently
// and would only say "incomplete" later.
void CheckModelServes(const SuggestRequest& request) {
    const ModelExamination model = ExamineSoundModel(request.modelDir);
    if (static_cast<int64_t>(request.params.numTransfers) > model.stylesPerCluster())
        throw UsageError("-n: " + std::to_string(request.params.numTransfers) + " is more than the " +
                         std::to_string(model.stylesPerCluster()) +
                         " styles this model keeps per scene; proposals would repeat");
}

std::string CountOfFaces(size_t count, const std::string& how) {
    return std::to_string(count) + (count == 1 ? " face " : " faces ") + how;
}

// Fills the document's faces as asked; returns the note printed and shown on the sheet.
std::string PlaceFaces(const SuggestRequest& request, const cv::Mat& rgb, TransferDocument& document) {
    switch (request.faces.kind) {
    case FaceRequest::Auto:
        for (const DetectedFace& face : DetectFaces(rgb, request.detector)) document.faces.push_back(face.box);
        document.faceSource = "auto";
        return CountOfFaces(document.faces.size(), "found (" + FaceDetectorName(request.detector) + ")");
    case FaceRequest::Given:
        document.faces = request.faces.boxes;
        document.faceSource = "given";
        return CountOfFaces(document.faces.size(), "given");
    case FaceRequest::None:
        break;
    }
    document.faceSource = "none";
    return "no face correction";
}

// The library's proposals for the packed R, G, B pixels, with the faces.
void ComputeProposals(const vora_api& api, const SuggestRequest& request, cv::Mat& rgb, TransferDocument& document) {
    VoraParameters params = request.params;
    params.faceRects = document.faces.empty() ? nullptr : document.faces.data();
    params.numFaceRects = static_cast<uint32_t>(document.faces.size());
    ImageHandle image = WrapWholeImage(rgb);
    document.transfers.resize(params.numTransfers);
    CheckStatus(api.compute_transfers(image.get(), document.transfers, params), request.photoPath);
    for (size_t k = 0; k < document.transfers.size(); ++k)
        CheckRenderable(document.transfers[k], request.photoPath + ": proposal " + std::to_string(k));
}

// Renders every proposal on `shown` into the staging folder; returns the
// contact sheet's entries, the original first.
std::vector<SheetEntry> RenderProposals(const vora_api& api, const SuggestRequest& request, const ParsedArgs& parsed,
                                        const Photo& photo, const cv::Mat& shown, const TransferDocument& document,
                                        const SuggestOutputs& outputs, StagingFolder& staging) {
    std::vector<SheetEntry> sheet;
    sheet.push_back({MakeThumbnail(shown, kThumbnailSide), "original", outputs.stem});
    ProgressBar bar("suggest");
    const double share = 1.0 / static_cast<double>(document.transfers.size());
    for (size_t k = 0; k < document.transfers.size(); ++k) {
        const TRANSFER& t = document.transfers[k];
        cv::Mat rendered = shown.clone();
        RenderInPlace(api, rendered, t, &bar, share * k, share * (k + 1));
        MixWithOriginal(shown, rendered, request.strength);
        WriteImage(staging.PathFor(fs::path(outputs.proposals[k]).filename().string()), rendered, false,
                   ImageTagsFor(parsed, photo));
        const std::string faces = t.faceCorrections.empty()
                                      ? std::string()
                                      : ", " + std::to_string(t.faceCorrections.size()) + " face(s) lifted";
        sheet.push_back({MakeThumbnail(rendered, kThumbnailSide),
                         "#" + std::to_string(k) + "  style " + std::to_string(t.styleIndex),
                         "cluster " + std::to_string(t.clusterIndex) + faces});
    }
    bar.Finish();
    return sheet;
}

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("suggest",
                      {ValueOption("-n"), ValueOption("--model"), RepeatedOption("--faces"), ValueOption("--detector"),
                       ValueOption("--out"), ValueOption("--format"), ValueOption("--ranking"), ValueOption("--solve"),
                       ValueOption("--limit"), ValueOption("--finish"), FlagOption("--force"),
                       ValueOption("--max-pixels"), ValueOption("--preview"), FlagOption("--full"),
                       ValueOption("--strength"), FlagOption("--keep-profile"), FlagOption("--strip-metadata")},
                      args);
    const SuggestRequest request = ParseRequest(parsed);
    const SuggestOutputs outputs = PlanOutputs(request, parsed.Value("--out"));
    CheckModelServes(request);

    Photo photo = ReadPhotoRgb(request.photoPath, MaxPixelsOption(parsed.Value("--max-pixels")));
    cv::Mat rgb = PackedRgb(photo);  // compute reads packed R, G, B only
    TransferDocument document;
    document.model = AbsoluteModelPath(request.modelDir);
    document.photo = request.photoPath;
    document.photoWidth = static_cast<uint64_t>(photo.pixels.cols);
    document.photoHeight = static_cast<uint64_t>(photo.pixels.rows);
    document.numTransfers = request.params.numTransfers;
    document.rankingFactor = request.params.rankingFactor;
    document.solveFactor = request.params.solveFactor;
    document.limitFactor = request.params.limitFactor;
    document.finishFactor = request.params.finishFactor;
    const std::string faceNote = PlaceFaces(request, rgb, document);
    const auto api = OpenModel(request.modelDir);
    ComputeProposals(*api, request, rgb, document);
    std::cout << request.photoPath << ": " << photo.pixels.cols << " x " << photo.pixels.rows << ", " << faceNote
              << "\n";

    // The set is written into a staging folder and moved into place at the
    // end: a failure midway (a full disk) or an interrupt leaves nothing, so
    // the command can simply be run again. Face corrections and tiles are
    // placed in normalised coordinates, so a transfer renders a scaled copy
    // as it renders the photo.
    StagingFolder staging(outputs.folder.string());
    const cv::Mat shown =
        request.previewSide > 0 ? ScaledToLongSide(photo.pixels, request.previewSide) : photo.pixels;
    if (shown.cols != photo.pixels.cols)
        std::cout << "previews: " << shown.cols << " x " << shown.rows << " (--full for full resolution)\n";
    const std::vector<SheetEntry> sheet =
        RenderProposals(*api, request, parsed, photo, shown, document, outputs, staging);
    const std::string heading = fs::path(request.photoPath).filename().string() + "  |  " + faceNote +
                                "  |  model " + request.modelDir;
    WriteImage(staging.PathFor("contact-sheet.png"), ComposeContactSheet(heading, sheet, document.faces), false);
    WriteFileAtomically(staging.PathFor("transfers.json"), SerializeTransfers(document), false);
    staging.Commit(request.force);

    for (size_t k = 0; k < document.transfers.size(); ++k)
        std::cout << "  " << k << "  style " << document.transfers[k].styleIndex << "  cluster "
                  << document.transfers[k].clusterIndex << "  " << outputs.proposals[k] << "\n";
    std::cout << "contact sheet: " << outputs.sheet << "\ntransfers: " << outputs.transfers << "\n";
    return kExitOk;
}

const RegisterCommand kRegistration({"suggest", "propose and render colour treatments for a photo", kHelp, Run});

}  // namespace
}  // namespace cli
}  // namespace vora
