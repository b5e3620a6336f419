#pragma once

#include <algorithm>
#include <chrono>
#include <cstdint>

#include "device/values/DeviceRecords.h"

namespace appsync {

/// The time as the database keeps it: milliseconds since 1970-01-01 00:00:00 UTC.
[[nodiscard]] inline std::int64_t milliseconds(WallTime time) {
    return std::chrono::duration_cast<std::chrono::milliseconds>(time.time_since_epoch()).count();
}

/// What lies beyond the clock's range, as in a database that somebody has altered, becomes its end.
[[nodiscard]] inline WallTime wallTime(std::int64_t milliseconds) {
    constexpr std::int64_t kFarthest =
        std::chrono::duration_cast<std::chrono::milliseconds>(WallTime::duration::max()).count();
    return WallTime(std::chrono::milliseconds(std::clamp(milliseconds, -kFarthest, kFarthest)));
}

[[nodiscard]] inline WallTime wallNow() { return std::chrono::system_clock::now(); }

}  // namespace appsync
