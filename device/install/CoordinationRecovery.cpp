#include "device/install/CoordinationRecovery.h"

#include <vector>

#include "device/database/CoordinationTables.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/install/Containers.h"
#include "device/install/InstallContext.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {

namespace {

using Freed = std::vector<std::string>;

Result<bool> isCoordinated(Database& database) {
    const Result<std::int64_t> value =
        database.integer("SELECT value FROM settings WHERE name = 'coordination'");
    if (!value) return value.error();
    return *value != 0;
}

Status forgetAll(Database& database, Freed& freed) {
    const Result<std::vector<StoredCoordinator>> all = allCoordinators(database);
    if (!all) return all.error();
    for (const StoredCoordinator& coordinator : *all) {
        RemovedCoordinator removed;
        if (Status gone = removeCoordinator(database, coordinator.id, removed); !gone) return gone;
        freed.push_back(removed.container);
    }
    return {};
}

Status forgetWithoutPlaceholder(Database& database) {
    return database
        .query(
            "DELETE FROM coordinators WHERE placeholder IN (?, ?)"
            " AND identifier NOT IN (SELECT identifier FROM placeholders)")
        .bind(static_cast<std::int64_t>(PlaceholderState::Stands),
              static_cast<std::int64_t>(PlaceholderState::Borrowed))
        .run();
}

Status forgetWithoutCoordinator(Database& database, Freed& freed) {
    Query rows = database.query(
        "DELETE FROM placeholders WHERE install_type = ?"
        " AND identifier NOT IN (SELECT identifier FROM coordinators) RETURNING container");
    rows.bind(static_cast<std::uint64_t>(kInstallTypeSync));
    while (rows.next()) freed.push_back(rows.text(0));
    return rows.status();
}

Status reconcile(Database& database, Freed& freed) {
    freed.clear();
    // Nobody is there who could want to hear of these.
    if (Status gone = database.query("DELETE FROM cancellations").run(); !gone) return gone;
    const Result<bool> coordinated = isCoordinated(database);
    if (!coordinated) return coordinated.error();
    if (!*coordinated) return forgetAll(database, freed);
    Status status = forgetWithoutPlaceholder(database);
    return status ? forgetWithoutCoordinator(database, freed) : status;
}

}  // namespace

Status reconcileCoordinators(const InstallContext& context) {
    Freed freed;
    const Status status = context.database.change(
        Durability::Soon, [&](Database& database) { return reconcile(database, freed); });
    if (!status) return status;
    for (const std::string& container : freed) context.containers.remove(container);
    return {};
}

Result<std::unordered_set<std::string>> deliveredFiles(const InstallContext& context) {
    std::unordered_set<std::string> paths;
    const Status status = context.database.read([&](Database& database) {
        Query rows = database.query(
            "SELECT path FROM promises"
            " WHERE complete <> 0 AND cancelled = 0 AND path IS NOT NULL");
        while (rows.next()) paths.insert(rows.text(0));
        return rows.status();
    });
    if (!status) return status.error();
    return paths;
}

}  // namespace appsync
