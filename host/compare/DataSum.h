#pragma once

#include <functional>
#include <string>

#include "host/compare/Holdings.h"
#include "platform/Result.h"

namespace appsync {

/// One sum of the names and contents of all files that an application's data consists of, on a
/// device or in a backup; times and modes count for nothing. Where a device has none but holds an
/// archive that a restore has left, it is that of the archive. `progress` hears the size of each
/// piece that was read.
[[nodiscard]] Result<std::string> sumOfData(
    const Holdings& holdings, const std::string& identifier,
    const std::function<void(std::uint64_t bytes)>& progress);

}  // namespace appsync
