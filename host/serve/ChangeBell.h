#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>

namespace appsync {

/// Rings whenever anything has changed on a device that is shown. Callable on any thread.
class ChangeBell {
  public:
    void ring();
    /// How often it has rung.
    [[nodiscard]] std::uint64_t rings() const;
    /// Waits until it has rung more often than that, for that long at most, and no longer than
    /// until it is silenced.
    void waitBeyond(std::uint64_t rings, std::chrono::milliseconds longest) const;

    /// Waits that long, or until it is silenced; not at all where the time is negative.
    void waitForSilence(std::chrono::milliseconds longest) const;

    /// It is over: nobody waits any more.
    void silence();
    [[nodiscard]] bool isSilenced() const;

  private:
    mutable std::mutex mutex_;
    mutable std::condition_variable rung_;
    std::uint64_t rings_ = 0;  // protected by mutex_
    bool isSilenced_ = false;  // likewise
};

}  // namespace appsync
