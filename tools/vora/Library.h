#pragma once

// The tool's side of the library boundary: opening a model, image objects
// with an owner, rendering tile by tile, and library statuses in plain words.
// Everything here goes through include/vora/vora.h only.

#include <vora/vora.h>

#include <memory>
#include <optional>
#include <string>

#include <opencv2/core.hpp>

namespace vora {
namespace cli {

// --model, else $VORA_MODEL, else ./model.
std::string ChooseModelDir(const std::string& given);

// For rendering a saved transfer: --model, else the model the transfers file
// records (when that folder still exists), else as ChooseModelDir.
std::string ChooseModelDirForRecord(const std::string& given, const std::string& recorded);

// The library joins the network folder to the directory without a separator
// (DIR + "net/"), so the tool always hands it a directory ending in '/'.
std::string WithTrailingSlash(const std::string& dir);

// The directory as an absolute, normalised path without a trailing separator,
// as recorded in transfers files.
std::string AbsoluteModelPath(const std::string& dir);

// Failure unless dir is an existing folder.
void RequireModelDirectory(const std::string& dir);

// Constructs the facade on dir. Failure when the folder is missing or the
// network does not load (the library reports that by the network loader's
// exception, which is turned into one line here).
std::unique_ptr<vora_api> OpenModel(const std::string& dir);

// OpenModel after examining the model's files (ModelFiles.h): Failure naming
// the first problem when they are broken, before the library reads them.
std::unique_ptr<vora_api> OpenExaminedModel(const std::string& dir);

struct ModelExamination;

// Completes an examination of the model's files (ModelFiles.h) with the
// network: constructs a facade on the directory, as any host would, and runs
// one compute on a small synthetic picture. Adds what fails to the problems;
// returns a line for a report.
std::string CheckModelNetwork(ModelExamination& model);

std::string StatusText(Status status);
// Failure("<subject>: <status in words>") unless status is STATUS_OK.
void CheckStatus(Status status, const std::string& subject);

// An image object owned by the tool: destroyed with the handle.
struct ImageObjectDeleter {
    void operator()(IImage* image) const {
        if (image) DestroyImageObj(image);
    }
};
using ImageHandle = std::unique_ptr<IImage, ImageObjectDeleter>;

// A whole image over the pixels of a continuous 8-bit matrix (3 or 4 channels).
ImageHandle WrapWholeImage(cv::Mat& pixels);

class ProgressBar;

// Rewrites pixels (continuous CV_8UC3 or CV_8UC4, R, G, B first) in place
// with the transfer, in bands of whole rows made with GetTileImageObj; the
// bytes equal those of one whole-image call. The bar, if any, moves from
// fraction `from` to `to` as the bands are done.
void RenderInPlace(const vora_api& api, cv::Mat& pixels, const TRANSFER& transfer, ProgressBar* bar = nullptr,
                   double from = 0.0, double to = 1.0);

// --strength S: how much of a look to use, 0 (the original) to 1 (the whole
// look, the default). Usage error outside [0, 1].
double StrengthOption(const std::optional<std::string>& value);

// Mixes restyled colours with the original ones: each colour byte becomes
// floor(o + S x (r - o) + 0.5), o the original byte, r the restyled one, in
// double precision; bytes from the fourth on (alpha) keep the restyled
// image's, which are the original's. Nothing changes at S = 1. Both images
// have the same size and type (8-bit, 3 or 4 channels).
void MixWithOriginal(const cv::Mat& original, cv::Mat& restyled, double strength);

// A progress bar on standard error, drawn only when it is a terminal.
class ProgressBar {
public:
    explicit ProgressBar(std::string label);
    ~ProgressBar();
    ProgressBar(const ProgressBar&) = delete;
    ProgressBar& operator=(const ProgressBar&) = delete;
    void Update(double fraction, const std::string& detail = std::string());
    void Finish();

private:
    std::string m_label;
    bool m_enabled;
    bool m_finished = false;
    int m_lastPercent = -1;
    std::string m_lastDetail;
};

}  // namespace cli
}  // namespace vora
