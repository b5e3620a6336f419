#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "device/archive/PackageError.h"
#include "device/archive/PackageLimits.h"
#include "platform/Result.h"

namespace appsync {

/// A file or a directory that goes into a package.
struct PackageItem {
    /// Where it stands on this machine.
    std::string path;
    /// Its name in the package, with a slash at its end if it is a directory.
    std::string entryName;
    /// The mode it gets in the package, its type included.
    std::uint32_t mode = 0;
    std::uint64_t size = 0;
    /// When its contents were changed last, in seconds since 1970, if the archive is to say so.
    std::optional<std::int64_t> modified = std::nullopt;
};

/// What goes into the package of a folder (see writePackage), in tree order. Refuses what no
/// package may hold.
[[nodiscard]] Result<std::vector<PackageItem>> listPackageFolder(const std::string& folder,
                                                                 const PackageLimits& limits);

/// The refusal to pack the file or folder at `path`.
[[nodiscard]] ErrorRecord cannotPack(PackageErrorCode code, std::string_view path,
                                     std::string_view reason);

}  // namespace appsync
