#pragma once

#include <string>

#include "platform/Bytes.h"
#include "platform/LogFacility.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

// What the store metadata of a restored application, a map, says of its placeholder. Values live as
// long as the map. A text of another type than string counts as absent.

namespace appsync {

struct Platform;

/// The store metadata in the serialised form in which a backup brings it. What is no map is an
/// error, which is logged at `failureLevel`.
[[nodiscard]] Result<PropertyList> parseRestoredMetadata(const Platform& platform,
                                                         const std::string& identifier,
                                                         const Bytes& data, LogLevel failureLevel);

/// The version; null when it is not told.
[[nodiscard]] const std::string* bundleVersionOf(const PropertyList& metadata);
/// The name to show: the title, or the item's name where there is no title at all. Null when there
/// is none; a title of another type than string is one that names nothing.
[[nodiscard]] const std::string* displayTitleOf(const PropertyList& metadata);
[[nodiscard]] bool isLaunchProhibited(const PropertyList& metadata);
[[nodiscard]] bool isPressel(const PropertyList& metadata);

}  // namespace appsync
