#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "platform/Result.h"

namespace appsync {

class Database;

// What the bundles of containers were when they were unpacked (device/package/BundleSum.h). An
// application that an earlier version of this program has installed has none. For sessions: a
// database of an earlier schema has no such table.

/// Records that of a container that is installed now.
Status recordSum(Database& database, const std::string& container, std::uint64_t sum);

[[nodiscard]] Result<std::optional<std::uint64_t>> findSum(Database& database,
                                                           const std::string& container);

/// Forgets those of containers that nothing stands in any more: neither an application nor what is
/// kept of one.
Status forgetOldSums(Database& database);

}  // namespace appsync
