#pragma once

#include <optional>
#include <string>
#include <vector>

#include "device/database/RegistryTables.h"
#include "platform/Result.h"

namespace appsync {

class Database;

// The versions that updates have replaced and that are kept for a rollback: one at most of each
// application, which goes with the application's row. Those that change something run inside a
// transaction. A database of an earlier version has none.

/// The version of that application that is kept, if one is. Its type is nobody's: it comes back as
/// the type of the application.
[[nodiscard]] Result<std::optional<BundleRow>> findKept(Database& database,
                                                        const std::string& identifier);

/// All of them, the one first that was replaced first.
[[nodiscard]] Result<std::vector<BundleRow>> allKept(Database& database);

/// Keeps a version that is replaced now. `freed` gets the name of the container that was kept
/// until now, or becomes empty.
Status keepReplaced(Database& database, const BundleRow& replaced, std::string& freed);

/// What stood in that container is kept no more.
Status forgetKept(Database& database, const std::string& container);

/// Exchanges the application's version with the one that is kept of it.
Status exchangeWithKept(Database& database, const BundleRow& application, const BundleRow& kept);

}  // namespace appsync
