#pragma once

#include <chrono>
#include <cstdint>

#include "device/values/DeviceRecords.h"

namespace appsync {

/// The time as the database keeps it: milliseconds since 1970-01-01 00:00:00 UTC.
[[nodiscard]] inline std::int64_t milliseconds(WallTime time) {
    return std::chrono::duration_cast<std::chrono::milliseconds>(time.time_since_epoch()).count();
}

[[nodiscard]] inline WallTime wallTime(std::int64_t milliseconds) {
    return WallTime(std::chrono::milliseconds(milliseconds));
}

[[nodiscard]] inline WallTime wallNow() { return std::chrono::system_clock::now(); }

}  // namespace appsync
