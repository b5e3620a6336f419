#pragma once

#include <cstddef>

#include "device/package/PackageLimits.h"
#include "platform/Result.h"

namespace appsync {

class PackageFile;

/// What the header before the contents of an entry takes at least, beside the name.
inline constexpr std::size_t kLocalHeaderBytes = 30;

/// Checks where the archive says how large its central directory is, and walks that directory once,
/// before libzip sets memory aside for what they claim. Refuses what has no end, or more than one
/// that could be it; too many entries; a count that is not true; names that hold a NUL. Memory is
/// bounded by the limits. Errors do not name the package.
[[nodiscard]] Status checkArchiveEnd(const PackageFile& file, const PackageLimits& limits);

}  // namespace appsync
