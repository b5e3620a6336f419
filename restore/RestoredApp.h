#pragma once

#include <cstdint>
#include <string>

#include "platform/Bytes.h"

namespace appsync {

// How an application of a backup had been demoted (offloaded). Any number but 0 is a demotion.
inline constexpr std::uint64_t kNotDemoted = 0;
inline constexpr std::uint64_t kIntentionallyDemoted = 1;
inline constexpr std::uint64_t kAutomaticallyDemoted = 2;

/// One application as a backup brings it back. Everything is borrowed.
struct RestoredApp {
    const std::string& identifier;
    /// Its store metadata, serialised.
    const Bytes& metadata;
    /// Null when there is none.
    const Bytes* sinf = nullptr;
    const Bytes* icon = nullptr;
    std::uint64_t demotionStatus = kNotDemoted;
};

}  // namespace appsync
