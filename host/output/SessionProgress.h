#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <optional>
#include <set>
#include <string>

#include "host/watch/SyncEvents.h"

namespace appsync {

/// How far a session as a whole has come, found out from its events. Nothing here ever goes back.
class SessionProgress {
  public:
    using Clock = std::chrono::steady_clock;

    void expect(const SyncTotals& totals) { totals_ = totals; }
    void add(const SyncEvent& event, Clock::time_point time);

    [[nodiscard]] const SyncTotals& totals() const { return totals_; }
    /// Applications with which it is over, well or not.
    [[nodiscard]] std::size_t applications() const { return ended_.size(); }
    /// Bytes of packages that have travelled.
    [[nodiscard]] std::uint64_t bytes() const { return bytes_; }
    /// Of the whole, in whole per cent, rounded down; 100 when all of it is over.
    [[nodiscard]] unsigned percent() const;
    /// Bytes in a second, of the last few; nothing where none have travelled in these.
    [[nodiscard]] std::optional<std::uint64_t> rate(Clock::time_point time) const;
    /// What it takes if it goes on as it went; nothing as long as that would be no more than a
    /// guess.
    [[nodiscard]] std::optional<std::chrono::seconds> left(Clock::time_point time) const;

  private:
    struct Sample {
        Clock::time_point time;
        std::uint64_t bytes;
    };

    void addBytes(const SyncEvent& event, Clock::time_point time);
    [[nodiscard]] double fraction() const;

    SyncTotals totals_;
    std::optional<Clock::time_point> begin_;
    std::map<std::string, std::uint64_t> sent_;  // bytes, by identifier
    std::uint64_t bytes_ = 0;
    std::set<std::string> ended_;
    std::deque<Sample> samples_;  // of the last few seconds, and the one before
};

}  // namespace appsync
