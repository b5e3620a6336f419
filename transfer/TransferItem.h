#pragma once

#include <optional>
#include <string>

#include "platform/PropertyList.h"

namespace appsync {

struct AppProxy;

/// An application that may be asked for, as the main loop of `outstandingAssetTransfers` reads it
/// from its item map.
struct TransferItem {
    std::string identifier;
    std::string bundlePath;
    /// The directory that holds the package's side files.
    std::string container;
    std::optional<std::string> version;
    /// The name that the host sent.
    std::optional<std::string> nameFromVessik;
    /// The name in the bundle's own info dictionary; no part of the item map.
    std::optional<std::string> displayName;
    bool isRestore = false;
    bool isIntentionallyDemoted = false;
    bool isAutomaticallyDemoted = false;
    bool isSystemApp = false;

    /// From an item map. A flag that answers to no boolean conversion is false.
    [[nodiscard]] static TransferItem fromItemMap(const PropertyList& item);
};

/// The item map of an entry of the todo list.
[[nodiscard]] PropertyList itemMapFromTodoEntry(const std::string& identifier,
                                                const PropertyList& entry);
/// The item map of a placeholder on the device.
[[nodiscard]] PropertyList itemMapFromPlaceholder(const AppProxy& placeholder);

}  // namespace appsync
