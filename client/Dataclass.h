#pragma once

#include <string_view>

namespace appsync {

/// The one dataclass that the plug-in owns.
inline constexpr std::string_view kDataclass = "Application";

}  // namespace appsync
