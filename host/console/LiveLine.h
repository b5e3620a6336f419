#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>

namespace appsync {

struct Console;

/// "asking the device, 790 of 1000" with as many of the words as there is room for: the count is
/// what tells that it goes on.
[[nodiscard]] std::string workWithin(const std::string& text, std::size_t width);

/// One line of a terminal that says from the beginning what is being done, and for how long, drawn
/// anew by a thread of its own; it is gone afterwards. Where there is no terminal that can redraw
/// lines, it says nothing. Callable on any thread.
class LiveLine {
  public:
    using Clock = std::chrono::steady_clock;

    /// The console outlives the line.
    explicit LiveLine(const Console& console);
    ~LiveLine() { clear(); }
    LiveLine(const LiveLine&) = delete;
    LiveLine& operator=(const LiveLine&) = delete;

    void say(std::string_view what);
    /// "reading packages, 3 of 9".
    void say(std::string_view what, std::size_t done, std::size_t count);

    /// Takes the line away, for good. To be called before anything else is printed.
    void clear();

  private:
    void drawOn();
    void draw();

    const Console& console_;
    const Clock::time_point begin_ = Clock::now();
    std::mutex mutex_;
    std::condition_variable over_;  // notified when it is to go
    // Guarded by mutex_.
    std::string what_;
    Clock::time_point drawn_;
    bool isDrawn_ = false;
    bool isOver_ = false;
    std::thread thread_;
};

}  // namespace appsync
