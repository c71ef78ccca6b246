#include "vora/Library.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <vector>

#include <unistd.h>

#include "model/FeatureNetwork.h"
#include "vora/Cli.h"
#include "vora/ModelFiles.h"

namespace vora {
namespace cli {

std::string ChooseModelDir(const std::string& given) {
    if (!given.empty()) return given;
    if (const char* env = std::getenv("VORA_MODEL"); env && *env) return env;
    return "./model";
}

std::string ChooseModelDirForRecord(const std::string& given, const std::string& recorded) {
    std::error_code ec;
    if (given.empty() && !recorded.empty() && std::filesystem::is_directory(recorded, ec)) return recorded;
    return ChooseModelDir(given);
}

std::string WithTrailingSlash(const std::string& dir) {
    if (dir.empty()) return "./";
    return dir.back() == '/' ? dir : dir + "/";
}

std::string AbsoluteModelPath(const std::string& dir) {
    std::error_code ec;
    std::string path = std::filesystem::absolute(dir, ec).lexically_normal().string();
    while (path.size() > 1 && path.back() == '/') path.pop_back();
    return path;
}

void RequireModelDirectory(const std::string& dir) {
    std::error_code ec;
    if (!std::filesystem::exists(dir, ec)) throw Failure(dir, "no such model directory");
    if (!std::filesystem::is_directory(dir, ec)) throw Failure(dir, "is not a directory (a model is a folder)");
}

std::unique_ptr<vora_api> OpenModel(const std::string& dir) {
    RequireModelDirectory(dir);
    try {
        return std::make_unique<vora_api>(WithTrailingSlash(dir));
    } catch (const cv::Exception& e) {
        throw Failure(dir, "the model's network does not load (" + e.err + "); run 'vora inspect " + dir + "'");
    } catch (const std::bad_alloc&) {
        throw;
    } catch (const std::exception& e) {
        throw Failure(dir, std::string("the model's network does not load (") + e.what() + "); run 'vora inspect " +
                               dir + "'");
    }
}

std::string StatusText(Status status) {
    switch (status) {
    case STATUS_OK:
        return "done";
    case STATUS_INVALID_ARGUMENT:
        return "the library refused the image (no pixels, or mismatched source and destination)";
    case STATUS_NO_TRANSFERS_REQUESTED:
        return "no transfers were requested";
    case STATUS_MODEL_INCOMPLETE:
        return "the model is incomplete: a data file is missing or the files disagree (see 'vora inspect')";
    case STATUS_NO_USABLE_STYLE:
        return "the model offers no usable style for this photo's scene (see 'vora inspect')";
    case STATUS_STYLE_INDEX_OUT_OF_RANGE:
        return "the style index is outside the model's style database";
    case STATUS_NON_FINITE_RESULT:
        return "the transfer came out with values that are not finite numbers: the model's style records "
               "hold NaN or infinity (see 'vora inspect')";
    }
    return "the library returned the unknown status " + std::to_string(static_cast<int>(status));
}

void CheckStatus(Status status, const std::string& subject) {
    if (status != STATUS_OK) throw Failure(subject, StatusText(status));
}

ImageHandle WrapWholeImage(cv::Mat& pixels) {
    CV_Assert(pixels.depth() == CV_8U && pixels.isContinuous());
    const size_t layout[4] = {0, 0, 0, 0};
    const size_t width = static_cast<size_t>(pixels.cols), height = static_cast<size_t>(pixels.rows);
    ImageHandle image(CreateImageObj(height, width, static_cast<size_t>(pixels.channels()), layout, pixels.data,
                                     CFullResImageSize(width, height), CTopLeftCoordinate(0, 0)));
    if (!image) throw std::bad_alloc();
    return image;
}

void RenderInPlace(const vora_api& api, cv::Mat& pixels, const TRANSFER& transfer, ProgressBar* bar, double from,
                   double to) {
    CV_Assert(pixels.depth() == CV_8U && pixels.isContinuous() && (pixels.channels() == 3 || pixels.channels() == 4));
    const size_t width = static_cast<size_t>(pixels.cols), height = static_cast<size_t>(pixels.rows);
    const size_t channels = static_cast<size_t>(pixels.channels());
    // Bands of about a million pixels: small enough for a smooth progress bar,
    // large enough that the library's threads have rows to share.
    const size_t bandRows = std::max<size_t>(1, std::min(height, (size_t{1} << 20) / std::max<size_t>(width, 1)));
    const size_t layout[4] = {0, 0, 0, 0};
    for (size_t top = 0; top < height; top += bandRows) {
        const size_t rows = std::min(bandRows, height - top);
        uint8_t* first = pixels.data + top * width * channels;
        ImageHandle tile(GetTileImageObj(rows, width, channels, layout, first, CFullResImageSize(width, height),
                                         CTopLeftCoordinate(0, top)));
        if (!tile) throw std::bad_alloc();
        CheckStatus(api.apply_transfer(tile.get(), transfer, tile.get()), "apply");
        if (bar) bar->Update(from + (to - from) * static_cast<double>(top + rows) / static_cast<double>(height));
    }
}

namespace {

// A small picture with some of everything (gradients, a face-sized blob of
// skin tone) for the network and the ranking to work on.
cv::Mat TestPicture() {
    cv::Mat rgb(96, 128, CV_8UC3);
    for (int y = 0; y < rgb.rows; ++y)
        for (int x = 0; x < rgb.cols; ++x) {
            uint8_t* p = rgb.ptr<uint8_t>(y) + 3 * x;
            p[0] = static_cast<uint8_t>(40 + 2 * x % 200);
            p[1] = static_cast<uint8_t>(60 + (x + y) % 150);
            p[2] = static_cast<uint8_t>(200 - y);
        }
    return rgb;
}

}  // namespace

// Loads the network through the library, as any host would, and runs one
// computation. Adds problems to the examination; returns a line for the report.
double StrengthOption(const std::optional<std::string>& value) {
    if (!value) return 1.0;
    (void)ParseFactor(*value, "--strength", 0.0, false, 1.0);  // the checks and their messages
    return std::strtod(value->c_str(), nullptr);                // the mix is in double: the value as written
}

void MixWithOriginal(const cv::Mat& original, cv::Mat& restyled, double strength) {
    if (strength == 1.0) return;
    // The result depends on the byte pair alone: one table for the call.
    std::vector<uint8_t> mixed(256 * 256);
    for (int o = 0; o < 256; ++o)
        for (int r = 0; r < 256; ++r)
            mixed[static_cast<size_t>(o) * 256 + static_cast<size_t>(r)] =
                static_cast<uint8_t>(std::floor(o + strength * (r - o) + 0.5));
    const int channels = restyled.channels();
    for (int y = 0; y < restyled.rows; ++y) {
        const uint8_t* from = original.ptr<uint8_t>(y);
        uint8_t* to = restyled.ptr<uint8_t>(y);
        for (int x = 0; x < restyled.cols; ++x, from += channels, to += channels)
            for (int c = 0; c < 3; ++c) to[c] = mixed[static_cast<size_t>(from[c]) * 256 + to[c]];
    }
}

std::unique_ptr<vora_api> OpenExaminedModel(const std::string& dir) {
    RequireModelDirectory(dir);
    const ModelExamination model = ExamineModelFiles(dir);
    if (model.broken())
        throw Failure(dir, "the model is broken: " + model.problems.front() + " (run 'vora inspect " + dir +
                               "' for the full report)");
    return OpenModel(dir);
}

std::string CheckModelNetwork(ModelExamination& model) {
    if (!model.definition.present || !model.weights.present) return "network: not loaded (files missing)";
    if (model.broken()) {
        // The facade would read the broken data files too; the network alone
        // tells whether it loads.
        try {
            (void)FeatureNetwork::Load(model.definition.path, model.weights.path);
        } catch (const cv::Exception& e) {
            model.problems.push_back("the network does not load: " + e.err);
            return "network: does not load";
        } catch (const std::bad_alloc&) {
            throw;
        } catch (const std::exception& e) {
            model.problems.push_back(std::string("the network does not load: ") + e.what());
            return "network: does not load";
        }
        return "network: loads (no test computation: the data files are broken)";
    }
    std::unique_ptr<vora_api> api;
    try {
        api = std::make_unique<vora_api>(WithTrailingSlash(model.dir));
    } catch (const cv::Exception& e) {
        model.problems.push_back("the network does not load: " + e.err);
        return "network: does not load";
    } catch (const std::exception& e) {
        model.problems.push_back(std::string("the network does not load: ") + e.what());
        return "network: does not load";
    }

    cv::Mat rgb = TestPicture();
    ImageHandle image = WrapWholeImage(rgb);
    VoraParameters params;
    params.numTransfers = 1;
    std::vector<TRANSFER> out(1);
    Status status;
    try {
        status = api->compute_transfers(image.get(), out, params);
    } catch (const cv::Exception& e) {
        model.problems.push_back("the network fails on a test picture: " + e.err);
        return "network: loads, but fails on a test picture";
    } catch (const std::exception& e) {
        model.problems.push_back(std::string("the network fails on a test picture: ") + e.what());
        return "network: loads, but fails on a test picture";
    }
    if (status == STATUS_MODEL_INCOMPLETE) {
        // The data files were found complete and in agreement above, so the
        // library's "incomplete" can only mean a short feature.
        model.problems.push_back("the network does not give the 512 values the library needs");
        return "network: loads, but its feature is too short";
    }
    if (status != STATUS_OK) {
        model.problems.push_back("a test computation fails: " + StatusText(status));
        return "network: loads, but a test computation fails";
    }
    return "network: loads and gives 512 values; a test picture was matched to cluster " +
           std::to_string(out[0].clusterIndex) + " and given style " + std::to_string(out[0].styleIndex);
}

ProgressBar::ProgressBar(std::string label) : m_label(std::move(label)), m_enabled(isatty(STDERR_FILENO) == 1) {}

ProgressBar::~ProgressBar() {
    // Leaving mid-way (an error): end the line so the error starts on its own.
    if (m_enabled && !m_finished && m_lastPercent >= 0) std::fputc('\n', stderr);
}

void ProgressBar::Update(double fraction, const std::string& detail) {
    if (!m_enabled) return;
    const int percent = static_cast<int>(std::clamp(fraction, 0.0, 1.0) * 100.0);
    if (percent == m_lastPercent && detail == m_lastDetail) return;
    m_lastPercent = percent;
    m_lastDetail = detail;
    constexpr int kWidth = 30;
    const int filled = percent * kWidth / 100;
    std::string bar(static_cast<size_t>(filled), '#');
    bar.append(static_cast<size_t>(kWidth - filled), '.');
    std::string shownDetail = detail.size() > 40 ? detail.substr(0, 37) + "..." : detail;
    std::fprintf(stderr, "\r%s [%s] %3d%% %-40s", m_label.c_str(), bar.c_str(), percent, shownDetail.c_str());
    std::fflush(stderr);
}

void ProgressBar::Finish() {
    if (!m_enabled || m_finished) return;
    Update(1.0, m_lastDetail);
    std::fputc('\n', stderr);
    m_finished = true;
}

}  // namespace cli
}  // namespace vora
