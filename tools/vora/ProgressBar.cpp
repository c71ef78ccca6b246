#include "vora/ProgressBar.h"

#include <algorithm>
#include <cstdio>
#include <utility>

#include <unistd.h>

namespace vora {
namespace cli {

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
