#pragma once

#include <chrono>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace appsync {

/// Knows which installs of a session wait for their applications to end, and when they have done so
/// for long enough: what counts is the time in which the session does nothing else, all of it
/// together. Without a limit it is never over. Callable on any thread.
class WaitLimit {
  public:
    using TimePoint = std::chrono::steady_clock::time_point;

    explicit WaitLimit(TimePoint now) : lastLook_(now) {}

    void set(std::chrono::milliseconds longest);
    /// Everything that was to be sent has been.
    void nothingMoreIsSent();

    // The life of an install; one that goes on may have to wait again.

    void isUnderWay(const std::string& identifier);
    void waits(const std::string& identifier);
    void goesOn(const std::string& identifier);
    void hasEnded(const std::string& identifier);

    /// To be asked now and then. The installs that wait, when the time is over; once.
    [[nodiscard]] std::vector<std::string> givenUpAt(TimePoint now);

  private:
    std::mutex mutex_;
    // Guarded by mutex_.
    std::optional<std::chrono::milliseconds> longest_;
    bool isAllSent_ = false;
    bool isOver_ = false;
    std::set<std::string> underWay_;
    std::set<std::string> waiting_;  // of these
    std::chrono::steady_clock::duration waited_{};
    TimePoint lastLook_;
};

}  // namespace appsync
