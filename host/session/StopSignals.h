#pragma once

#include <atomic>
#include <chrono>
#include <functional>
#include <thread>

namespace appsync {

/// Turns SIGINT, SIGTERM and SIGHUP into a request to stop, while it lives. Make it before any
/// other thread of the process: threads inherit that these signals are blocked.
///
/// The first signal raises `stopRequested` and calls `stopping`. When this object still lives
/// `patience` later, or when a second signal comes, `giveUp` is called; it should end the process,
/// and while it runs, one more signal does. Both are called on a thread of this object's own.
class StopSignals {
  public:
    StopSignals(std::chrono::milliseconds patience, std::function<void()> stopping,
                std::function<void()> giveUp);
    StopSignals(const StopSignals&) = delete;
    StopSignals& operator=(const StopSignals&) = delete;
    /// Signals act as they did before.
    ~StopSignals();

    [[nodiscard]] const std::atomic<bool>& stopRequested() const noexcept { return requested_; }

  private:
    void watch();
    void leave();

    const std::chrono::milliseconds patience_;
    const std::function<void()> stopping_;
    const std::function<void()> giveUp_;
    std::atomic<bool> requested_ = false;
    int signals_ = -1;  // a descriptor that signals arrive on
    int ended_ = -1;    // a descriptor that the destructor makes readable
    std::thread watcher_;
};

}  // namespace appsync
