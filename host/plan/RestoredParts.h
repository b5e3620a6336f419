#pragma once

#include <string>

#include "platform/Result.h"

namespace appsync {

class Device;

/// What a package that belongs to a restore is sent as where nobody says so ("AssetParts"). Where
/// data of its application waits on the device, or is announced: the package alone, which waits for
/// that data. Else package and data at once, as nothing would ever end its waiting.
[[nodiscard]] Result<unsigned> partsOfRestored(Device& device, const std::string& identifier);

}  // namespace appsync
