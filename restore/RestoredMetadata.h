#pragma once

#include <string>

#include "platform/PropertyList.h"

// What the store metadata of a restored application, a map, says of its placeholder. Values live as
// long as the map. A text of another type than string counts as absent.

namespace appsync {

/// The version; null when it is not told.
[[nodiscard]] const std::string* bundleVersionOf(const PropertyList& metadata);
/// The name to show; null when there is none.
[[nodiscard]] const std::string* displayTitleOf(const PropertyList& metadata);
[[nodiscard]] bool isLaunchProhibited(const PropertyList& metadata);
[[nodiscard]] bool isPressel(const PropertyList& metadata);

}  // namespace appsync
