// The terminal progress bar: redrawn in place with a carriage return, only when the shown percentage changes.
#include "app/Progress.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <iostream>
#include <unistd.h>

namespace App {

namespace {
std::atomic<bool> g_Quiet{false};
}

void SetQuiet(bool quiet) noexcept {
    g_Quiet = quiet;
}

bool IsQuiet() noexcept {
    return g_Quiet;
}

ProgressBar::ProgressBar(std::string label)
    : ProgressBar(std::move(label), !IsQuiet() && ::isatty(STDERR_FILENO) ? &std::cerr : nullptr,
                  kDefaultDelay) {}

ProgressBar::ProgressBar(std::string label, std::ostream* out, std::chrono::milliseconds delay)
    : m_Label(std::move(label))
    , m_Out(out)
    , m_Delay(delay)
    , m_Start(std::chrono::steady_clock::now()) {}

ProgressBar::~ProgressBar() {
    Finish();
}

void ProgressBar::Update(double fraction) {
    if (!m_Out) return;
    std::lock_guard lock(m_Mutex);
    if (std::chrono::steady_clock::now() - m_Start < m_Delay) return;
    fraction = std::isfinite(fraction) ? std::clamp(fraction, 0.0, 1.0) : 0.0;
    const int percent = int(fraction * 100.0);
    if (percent == m_Shown) return;
    m_Shown = percent;
    const int filled = int(fraction * kWidth);
    *m_Out << '\r' << m_Label << " [" << std::string(std::size_t(filled), '#')
           << std::string(std::size_t(kWidth - filled), ' ') << "] " << percent << '%' << std::flush;
}

void ProgressBar::Finish() {
    std::lock_guard lock(m_Mutex);
    if (m_Out && m_Shown >= 0) *m_Out << '\n' << std::flush;
    m_Shown = -1;
    m_Out = nullptr;
}

} // namespace App
