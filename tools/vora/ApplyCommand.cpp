// vora apply: one saved transfer rendered onto a photo at full resolution,
// or onto many photos into a folder.

#include <algorithm>
#include <atomic>
#include <cmath>
#include <condition_variable>
#include <filesystem>
#include <iostream>
#include <map>
#include <memory>
#include <mutex>
#include <thread>

#include "vora/Cli.h"
#include "vora/Images.h"
#include "vora/ModelChoice.h"
#include "vora/OutputFiles.h"
#include "vora/ProgressBar.h"
#include "vora/Rendering.h"
#include "vora/TransferJson.h"

namespace vora {
namespace cli {
namespace {

const char* const kSynopsis =
    "apply PHOTO TRANSFERS.json[:K] OUT [options]\n       vora apply PHOTO... TRANSFERS.json[:K] --out-dir DIR [options]";

const char* const kHelp =
    "usage: vora apply PHOTO TRANSFERS.json[:K] OUT [options]\n"
    "       vora apply PHOTO... TRANSFERS.json[:K] --out-dir DIR [options]\n"
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
    "               (default 128000000)\n"
    "\n"
    "With --out-dir, every PHOTO is rendered into DIR (made if missing) under its\n"
    "own name, several at a time; outputs that exist are skipped unless --force.\n"
    "One progress bar, then a summary; the exit status is 1 if any photo failed,\n"
    "all the others being done.\n"
    "  --out-dir DIR  folder of the outputs\n"
    "  --format EXT   outputs' format: jpg, png, tif or webp (default: each photo's own)\n"
    "  --jobs N       photos rendered at once, 1 to 64 (default: the cores, at most 4);\n"
    "               memory grows with N, about 13 bytes per pixel each\n";

struct BatchItem {
    std::string photo;
    std::string output;
};

// Output paths of a batch: DIR/STEM.EXT, EXT the photo's own or --format's.
// Two photos may not share one.
std::vector<BatchItem> PlanBatch(const std::vector<std::string>& photos, const std::string& outDir,
                                 const std::optional<std::string>& format) {
    std::vector<BatchItem> items;
    std::map<std::string, std::string> byOutput;
    for (const std::string& photo : photos) {
        const std::filesystem::path in(photo);
        const std::string ext = format ? "." + *format : in.extension().string();
        const std::string output = (std::filesystem::path(outDir) / (in.stem().string() + ext)).string();
        CheckImageExtension(output);
        const auto [at, fresh] = byOutput.emplace(output, photo);
        if (!fresh) throw UsageError(photo + ": would be written to " + output + ", as " + at->second + " is");
        items.push_back({photo, output});
    }
    return items;
}

// Reads, renders and writes one photo; returns its size. Throws what
// ReadPhotoRgb and WriteImage throw.
cv::Size RenderOne(const vora_api& api, const TRANSFER& transfer, const TransferDocument& document, double strength,
               const ParsedArgs& parsed, const std::string& photoPath, const std::string& outPath, bool force,
               ProgressBar* bar) {
    Photo photo = ReadPhotoRgb(photoPath, MaxPixelsOption(parsed.Value("--max-pixels")));

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
    RenderInPlace(api, photo.pixels, transfer, bar);
    if (bar != nullptr) bar->Finish();
    MixWithOriginal(original, photo.pixels, strength);
    WriteImage(outPath, photo.pixels, force, ImageTagsFor(parsed, photo));
    return photo.pixels.size();
}

// The record to render, where it came from, and the model to render it with.
struct Look {
    TransferDocument document;
    TRANSFER transfer;
    std::string where;  // "file:K"
    std::unique_ptr<vora_api> api;
};

Look LoadLook(const ParsedArgs& parsed, const TransferReference& reference) {
    Look look;
    look.transfer = LoadTransferRecord(reference, &look.document);
    look.where = reference.path + ":" + std::to_string(reference.index);
    CheckRenderable(look.transfer, look.where);
    look.api = OpenExaminedModel(ChooseModelDirForRecord(parsed.Value("--model").value_or(""), look.document.model));
    return look;
}

int RunBatch(const ParsedArgs& parsed, const std::vector<std::string>& photos, const TransferReference& reference,
             const std::string& outDir, bool force, double strength) {
    std::optional<std::string> format = parsed.Value("--format");
    if (format) {
        std::transform(format->begin(), format->end(), format->begin(), [](unsigned char c) { return std::tolower(c); });
        if (*format == "jpeg") format = "jpg";
        if (*format == "tiff") format = "tif";
        if (*format != "jpg" && *format != "png" && *format != "tif" && *format != "webp")
            throw UsageError("--format: '" + *format + "' is not one of jpg, png, tif, webp");
    }
    const unsigned cores = std::max(1u, std::thread::hardware_concurrency());
    const size_t jobs = parsed.Value("--jobs")
                            ? static_cast<size_t>(ParseInteger(*parsed.Value("--jobs"), "--jobs", 1, 64))
                            : std::min(cores, 4u);
    std::error_code ec;
    if (std::filesystem::exists(outDir, ec) && !std::filesystem::is_directory(outDir, ec))
        throw UsageError(outDir + ": is not a folder (--out-dir)");
    const std::vector<BatchItem> items = PlanBatch(photos, outDir, format);

    const Look look = LoadLook(parsed, reference);
    std::filesystem::create_directories(outDir, ec);
    if (!std::filesystem::is_directory(outDir, ec)) throw Failure(outDir, "cannot make this folder");

    std::vector<const BatchItem*> queue;
    size_t skipped = 0;
    for (const BatchItem& item : items) {
        if (!force && std::filesystem::exists(item.output, ec))
            ++skipped;
        else
            queue.push_back(&item);
    }

    // Each worker holds one photo at a time, so memory is bounded by the
    // number of jobs whatever the number of photos.
    std::mutex mutex;
    std::condition_variable progress;
    std::atomic<size_t> next{0};
    size_t finished = 0;
    std::vector<std::string> failures;
    auto work = [&] {
        for (size_t i = next++; i < queue.size(); i = next++) {
            std::string failure;
            try {
                RenderOne(*look.api, look.transfer, look.document, strength, parsed, queue[i]->photo,
                          queue[i]->output, force, nullptr);
            } catch (const CliError& e) {
                failure = e.what();
            } catch (const std::exception& e) {
                failure = queue[i]->photo + ": " + e.what();
            }
            const std::lock_guard<std::mutex> lock(mutex);
            if (!failure.empty()) failures.push_back(failure);
            ++finished;
            progress.notify_one();
        }
    };
    std::vector<std::thread> workers;
    for (size_t j = 0; j < std::min(jobs, queue.size()); ++j) workers.emplace_back(work);
    {
        ProgressBar bar("apply");
        std::unique_lock<std::mutex> lock(mutex);
        while (finished < queue.size()) {
            bar.Update(static_cast<double>(finished) / static_cast<double>(queue.size()),
                       std::to_string(finished) + "/" + std::to_string(queue.size()));
            progress.wait(lock);
        }
        bar.Finish();
    }
    for (std::thread& worker : workers) worker.join();

    for (const std::string& failure : failures) PrintError(failure);
    std::cout << "apply: " << (queue.size() - failures.size()) << " done, " << skipped << " skipped"
              << (skipped > 0 ? " (their outputs exist; --force replaces them)" : "") << ", " << failures.size()
              << " failed; " << look.where << " into " << outDir << "\n";
    return failures.empty() ? kExitOk : kExitFailure;
}

bool LooksLikeTransferReference(const std::string& argument) {
    const size_t json = argument.rfind(".json");
    if (json == std::string::npos) return false;
    const std::string rest = argument.substr(json + 5);
    return rest.empty() || (rest.size() > 1 && rest[0] == ':' &&
                            std::all_of(rest.begin() + 1, rest.end(), [](unsigned char c) { return std::isdigit(c); }));
}

int Run(const std::vector<std::string>& args) {
    ParsedArgs parsed("apply",
                      {ValueOption("--model"), FlagOption("--force"), ValueOption("--max-pixels"),
                       ValueOption("--strength"), FlagOption("--keep-profile"), FlagOption("--strip-metadata"),
                       ValueOption("--out-dir"), ValueOption("--format"), ValueOption("--jobs")},
                      args);
    const std::optional<std::string> outDir = parsed.Value("--out-dir");
    const bool force = parsed.Flag("--force");
    const double strength = StrengthOption(parsed.Value("--strength"));
    if (outDir) {
        parsed.ExpectPositionals(2, SIZE_MAX, kSynopsis);
        std::vector<std::string> photos = parsed.positionals();
        const TransferReference reference = ParseTransferReference(photos.back());
        photos.pop_back();
        return RunBatch(parsed, photos, reference, *outDir, force, strength);
    }
    const std::vector<std::string>& positionals = parsed.positionals();
    if (positionals.size() > 3 || (positionals.size() == 3 && LooksLikeTransferReference(positionals[2])))
        throw UsageError("apply: several photos need --out-dir DIR (vora apply PHOTO... TRANSFERS.json[:K] --out-dir DIR)");
    if (parsed.Value("--format") || parsed.Value("--jobs"))
        throw UsageError(std::string(parsed.Value("--format") ? "--format" : "--jobs") + " goes with --out-dir");
    parsed.ExpectPositionals(3, 3, kSynopsis);
    const std::string photoPath = positionals[0];
    const TransferReference reference = ParseTransferReference(positionals[1]);
    const std::string outPath = positionals[2];

    CheckImageExtension(outPath);
    CheckOutputPath(outPath, {photoPath, reference.path}, force);

    const Look look = LoadLook(parsed, reference);

    ProgressBar bar("apply");
    const cv::Size size =
        RenderOne(*look.api, look.transfer, look.document, strength, parsed, photoPath, outPath, force, &bar);
    std::cout << outPath << ": " << size.width << " x " << size.height << ", " << look.where << " (style "
              << look.transfer.styleIndex << ", cluster " << look.transfer.clusterIndex << ")\n";
    return kExitOk;
}

const RegisterCommand kRegistration({"apply", "render a saved transfer onto a photo at full resolution", kHelp, Run});

}  // namespace
}  // namespace cli
}  // namespace vora
