#pragma once

#include "platform/InstallPlaceholder.h"
#include "platform/PropertyList.h"

namespace appsync {

/// The attributes as messages show them.
[[nodiscard]] inline PropertyList mapOf(const PlaceholderAttributes& attributes) {
    PropertyList map = PropertyList::map(
        {{"info", attributes.info}, {"launchProhibited", attributes.launchProhibited}});
    if (attributes.bundleVersion) map.set("bundleVersion", *attributes.bundleVersion);
    return map;
}

}  // namespace appsync
