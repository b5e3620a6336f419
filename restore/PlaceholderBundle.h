#pragma once

#include <string>
#include <string_view>

#include "platform/FileSystem.h"
#include "platform/PropertyList.h"

namespace appsync {

/// The icon's name in a placeholder bundle.
inline constexpr std::string_view kPlaceholderIconFile = "Icon.png";

/// Key of an info dictionary (boolean): the application may not be started.
inline constexpr std::string_view kLaunchProhibitedKey = "RGApplicationLaunchProhibited";

/// Whom a placeholder bundle and what is in it belong to.
[[nodiscard]] inline FileAttributes placeholderFileAttributes() { return {"mobile", "mobile"}; }

/// The boolean at the key. What is absent or answers to no boolean conversion is false.
[[nodiscard]] inline bool flagAt(const PropertyList& map, std::string_view key) {
    const PropertyList* flag = map.find(key);
    return flag != nullptr && flag->booleanConversion().value_or(false);
}

}  // namespace appsync
