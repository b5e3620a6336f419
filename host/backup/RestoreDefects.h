#pragma once

#include <string>

#include "platform/Result.h"

namespace appsync {

class PropertyList;
class PropertyListSerialization;

/// What keeps a device from making a placeholder of an entry of the restore information, in words
/// that follow "because"; empty when nothing is known to. Where installs are coordinated, an
/// application needs neither title nor version.
[[nodiscard]] std::string defectOfRestoreEntry(const PropertyList& entry,
                                               PropertyListSerialization& propertyLists,
                                               bool isCoordinated);

/// What is wrong with a list of offloaded applications; empty when nothing is.
[[nodiscard]] std::string defectOfDemotedApps(const Result<PropertyList>& list);

}  // namespace appsync
