#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "device/values/DeviceRecords.h"
#include "platform/AppRegistry.h"
#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

class Database;

/// Which of the two tables of bundles.
enum class BundleTable { Applications, Placeholders };

/// A row of one of them.
struct BundleRow {
    std::string identifier;
    std::optional<std::string> version;
    std::optional<std::string> name;
    std::string type{kApplicationTypeUser};
    std::uint64_t installType = 0;
    std::string container;  // its name, see Containers
    std::string bundle;     // the name of the directory in it
    std::string iconFile;
    std::uint64_t bytes = 0;
};

/// What only placeholders have.
struct PlaceholderExtras {
    std::optional<Bytes> sinf;
    /// Of a placeholder whose files were not synced: the boot of the machine that wrote them.
    std::optional<std::string> unsyncedBoot;
};

/// The containers that a change of the tables left without a record; empty names stand for none.
struct FreedContainers {
    std::string application;
    std::string placeholder;
    /// Of a version that is kept no more.
    std::string kept;
    /// No freed one: that of the version that was replaced, and is kept from now on.
    std::string replaced;
};

[[nodiscard]] AppProxy proxyOf(const BundleRow& row, BundleTable table);
[[nodiscard]] ApplicationRecord recordOf(const BundleRow& row, BundleTable table);

// The statements on the tables of bundles. Those that change something run inside a transaction.

[[nodiscard]] Result<std::optional<BundleRow>> findBundle(Database& database, BundleTable table,
                                                          const std::string& identifier);

/// A row, and the table that has it.
struct FoundBundle {
    BundleRow row;
    BundleTable table = BundleTable::Applications;
};
/// The placeholder of that identifier where there is one, else the application.
[[nodiscard]] Result<std::optional<FoundBundle>> findUppermost(Database& database,
                                                               const std::string& identifier);

/// Whether there is an application, no mere placeholder, of that identifier.
[[nodiscard]] Result<bool> isInstalled(Database& database, const std::string& identifier);

/// Every row of the table, ordered by identifier.
[[nodiscard]] Result<std::vector<BundleRow>> allBundles(Database& database, BundleTable table);

/// The rows of the table with that application type ("User", "System"), ordered by identifier.
[[nodiscard]] Result<std::vector<BundleRow>> bundlesOfType(Database& database, BundleTable table,
                                                           std::string_view type);

/// The placeholders of installs that were announced and have not ended, in the order in which they
/// came.
[[nodiscard]] Result<std::vector<BundleRow>> placeholdersWithProgress(Database& database);

/// Every identifier once, in the order in which they first came to the device.
[[nodiscard]] Result<std::vector<std::string>> identifiersByArrival(Database& database);

/// Puts an application in, in place of the one that was there, and takes its placeholder away with
/// all that waited for the install. Type and install type come from what is replaced; the row's
/// own count where there is nothing. What is replaced is kept if it is of another version.
Status recordInstalled(Database& database, const BundleRow& row, FreedContainers& freed);

/// Puts a placeholder in, in place of the one that was there.
Status recordPlaceholder(Database& database, const BundleRow& row, const PlaceholderExtras& extras,
                         FreedContainers& freed);

/// Takes the row of an application away, and with it that of the version that is kept of it.
Status forgetApplication(Database& database, const std::string& identifier, FreedContainers& freed);

/// Takes the row of a placeholder away. `container` gets the name of its container, or becomes
/// empty when there was none.
Status forgetPlaceholder(Database& database, const std::string& identifier, std::string& container);

}  // namespace appsync
