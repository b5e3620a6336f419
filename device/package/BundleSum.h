#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "device/archive/PackageEntries.h"
#include "platform/Result.h"

namespace appsync {

class RootDirectory;

// A number that tells whether a bundle on a device still is the one that was unpacked: of each
// file its name, its size, the CRC of its contents and whether its owner may run it, of each
// directory its name. What somebody alters on purpose may have the same; damage has not.

/// That of the bundle directory of a package, whose entries are arranged as a tree. Nothing is
/// read: a package says itself what the CRC of each file is, and an unpacking holds it to that.
[[nodiscard]] std::uint64_t sumOfEntries(const std::vector<PackageEntry>& entries,
                                         std::string_view bundle);

/// That of the bundle at a device path. Reads all of it; no link is followed. What is neither file
/// nor directory makes a number that no package has.
[[nodiscard]] Result<std::uint64_t> sumOfBundle(const RootDirectory& root,
                                                const std::string& bundle);

}  // namespace appsync
