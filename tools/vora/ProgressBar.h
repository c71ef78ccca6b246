#pragma once

#include <string>

namespace vora {
namespace cli {

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
