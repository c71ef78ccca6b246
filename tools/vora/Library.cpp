#include "vora/Library.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <iostream>

#include <unistd.h>

#include "vora/Cli.h"

namespace vora {
namespace cli {

std::string ChooseModelDir(const std::string& given) {
    if (!given.empty()) return given;
    if (const char* env = std::getenv("VORA_MODEL"); env && *env) return env;
    return "./model";
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
