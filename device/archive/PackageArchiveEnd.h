#pragma once

#include <cstdint>

#include "device/archive/PackageLimits.h"
#include "platform/Result.h"

namespace appsync {

class PackageFile;

/// Where the central directory lies, as the end of the archive has it.
struct ArchiveDirectoryPlace {
    std::uint64_t offset = 0;
    std::uint64_t size = 0;
    std::uint64_t count = 0;
    /// The count of what no larger number has been kept for.
    bool countIsModulo65536 = false;
};

/// Finds the end of the archive, which ends the file, and what it says. Refuses what has no end, or
/// more than one that could be it; ends that contradict each other; a directory that does not lie
/// right before its end, or is larger than the limits allow; archives in several parts. Errors do
/// not name the package.
[[nodiscard]] Result<ArchiveDirectoryPlace> findArchiveDirectory(const PackageFile& file,
                                                                 const PackageLimits& limits);

/// The refusal of more entries than the limits allow.
[[nodiscard]] ErrorRecord tooManyEntries(const PackageLimits& limits);

}  // namespace appsync
