#pragma once

#include <string_view>

#include "device/archive/PackageLimits.h"
#include "device/package/PackageReader.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

/// The icon's file where an Info.plist names none.
inline constexpr std::string_view kUsualIconFile = "Icon.png";

/// What an Info.plist says, its values checked: the texts and `info` of the result; the rest is
/// left to the reader. Errors do not name the package.
[[nodiscard]] Result<PackageInfo> packageInfoFrom(PropertyList info,
                                                  std::string_view bundleDirectoryName,
                                                  const PackageLimits& limits);

}  // namespace appsync
