#pragma once

#include <chrono>
#include <functional>
#include <string>

namespace appsync {

struct Console;

/// One line of a terminal that says how far something is while it takes long, and is gone
/// afterwards. Where there is no terminal that can redraw lines, it says nothing.
class ProgressLine {
  public:
    using Clock = std::chrono::steady_clock;

    /// The console outlives the line. `now` is the time.
    explicit ProgressLine(const Console& console,
                          std::function<Clock::time_point()> now = Clock::now);
    ~ProgressLine() { clear(); }
    ProgressLine(const ProgressLine&) = delete;
    ProgressLine& operator=(const ProgressLine&) = delete;

    /// Draws what `text` gives, unless it has not taken long yet or the line has been drawn but
    /// just now. May be called as often as one likes.
    void show(const std::function<std::string()>& text);

    /// Takes the line away. To be called before anything else is printed.
    void clear();

  private:
    const Console& console_;
    const std::function<Clock::time_point()> now_;
    Clock::time_point due_;
    bool isDrawn_ = false;
};

}  // namespace appsync
