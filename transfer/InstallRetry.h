#pragma once

#include <chrono>

namespace appsync {

/// How long an install whose termination assertion was denied waits for its next try.
inline constexpr std::chrono::seconds kInstallRetryDelay{30};

}  // namespace appsync
