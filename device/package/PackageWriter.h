#pragma once

#include <string>

#include "device/package/PackageReader.h"
#include "platform/Result.h"

namespace appsync {

class PropertyListSerialization;

/// Makes an application package from a folder of this machine, which holds `<Name>.app/` and
/// optionally `VessikMetadata.plist`, and nothing else, or is itself `<Name>.app`, whose neighbour
/// `VessikMetadata.plist` goes in with it.
///
/// The package is the same, byte for byte, for the same names, contents and modes. Modes are
/// reduced to 0755 (directories, and files that their owner can execute) and 0644. Whatever a
/// reader would refuse is refused, named by its path: links, pipes, illegal names, no Info.plist
/// ...
///
/// The package is written beside `package` under a temporary name, read back, and then renamed:
/// after a failure what stood at `package` before still stands there. Only a regular file is
/// replaced. Gives what the package says of itself.
[[nodiscard]] Result<PackageInfo> writePackage(const std::string& folder,
                                               const std::string& package,
                                               PropertyListSerialization& propertyLists);

}  // namespace appsync
