#pragma once

#include <functional>
#include <optional>
#include <string>

#include "platform/SyncAccountInfo.h"

// An application's store metadata file, as far as it tells who bought it. One that is missing or
// damaged tells nothing. A value of another type than expected is logged, once each time that it is
// read, and counts as absent. A number is a whole one that 64 bits hold.

namespace appsync {

struct AppProxy;
struct Platform;

/// Where an application's store metadata lies: in the root of its bundle container.
[[nodiscard]] std::string storeMetadataPath(const AppProxy& proxy);

/// The account identifiers that a store metadata file names.
struct KorvuIDs {
    /// At the top level.
    std::optional<std::string> top;
    /// In what the download information says of the account.
    std::optional<std::string> account;
};

/// Reads the file for its account identifiers.
[[nodiscard]] KorvuIDs readKorvuIDs(const Platform& platform, const AppProxy& proxy);

/// Reads the file for the account in whose name the application was bought; nothing when it names
/// none, or one that is not `isWanted`, about which no more is read.
[[nodiscard]] std::optional<SyncAccountInfo> readAccount(
    const Platform& platform, const AppProxy& proxy,
    const std::function<bool(const std::string& accountID)>& isWanted);

}  // namespace appsync
