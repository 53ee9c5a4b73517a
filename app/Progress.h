#pragma once
// A progress bar on standard error for long work, shown only on a terminal and silenced by --quiet.

#include <chrono>
#include <functional>
#include <iosfwd>
#include <mutex>
#include <string>

namespace App {

// The global --quiet: no progress bars.
void SetQuiet(bool quiet) noexcept;
bool IsQuiet() noexcept;

class ProgressBar {
public:
    // Draws on standard error when it is a terminal and --quiet was not given, once the work has taken longer
    // than delay.
    explicit ProgressBar(std::string label);
    // Draws on out (null: nowhere) regardless of terminals and --quiet; for tests.
    ProgressBar(std::string label, std::ostream* out, std::chrono::milliseconds delay);
    ~ProgressBar();
    ProgressBar(const ProgressBar&) = delete;
    ProgressBar& operator=(const ProgressBar&) = delete;

    // The fraction done, 0..1, from any thread.
    void Update(double fraction);
    // A callback for RenderJobOptions, TileRenderOptions and the like; valid while the bar lives.
    std::function<void(double)> Callback() {
        return [this](double fraction) { Update(fraction); };
    }
    // Ends the bar's line if it was drawn; called by the destructor too.
    void Finish();

    static constexpr std::chrono::milliseconds kDefaultDelay{500};
    static constexpr int kWidth = 30; // characters between the brackets

private:
    std::mutex m_Mutex;
    std::string m_Label;
    std::ostream* m_Out;
    std::chrono::milliseconds m_Delay;
    std::chrono::steady_clock::time_point m_Start;
    int m_Shown = -1; // the percentage on screen, -1 before the first draw
};

} // namespace App
