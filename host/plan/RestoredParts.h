#pragma once

#include <optional>
#include <string>

#include "platform/Result.h"

namespace appsync {

class Device;

/// What a package that belongs to a restore is sent as where nobody says so ("AssetParts"). Where
/// data of its application waits on the device, or is announced: the package alone, which waits for
/// that data. Else package and data at once, as nothing would ever end its waiting.
[[nodiscard]] Result<unsigned> partsOfRestored(Device& device, const std::string& identifier);

/// The version under which the package of a restore waits for its data; nothing when none does, or
/// when a crash has taken the package, or what says that it was installed.
[[nodiscard]] std::optional<std::string> versionThatWaitsForData(Device& device,
                                                                 const std::string& identifier);

/// How to bring a restored application whose data the device knows of: "send its package (appsync
/// send ...), then ...". `packageWaits`: the package is there already.
[[nodiscard]] std::string howRestoredDataComes(const std::string& identifier, bool packageWaits);

/// How to bring a restored application where installs are not coordinated.
[[nodiscard]] std::string howRestoredComes(Device& device, const std::string& identifier);

}  // namespace appsync
