#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "platform/InstallPromises.h"

namespace appsync {

/// What there is to know of a promise.
struct PromiseValues {
    std::string name;
    CoordinationClient client = 0;
    std::optional<std::string> path;  // a device path
    std::uint64_t diskSpaceNeeded = 0;
    double percent = 0;  // from 0 to 1
    bool complete = false;
    bool cancelled = false;
};

}  // namespace appsync
