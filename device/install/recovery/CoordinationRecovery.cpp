#include "device/install/recovery/CoordinationRecovery.h"

#include <vector>

#include "device/database/CoordinationTables.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/install/Containers.h"
#include "device/install/InstallContext.h"
#include "platform/InstallProgressRecord.h"
#include "platform/InstallPromises.h"

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

Result<std::vector<std::string>> restoredWithoutCoordinator(Database& database) {
    Query rows = database.query(
        "SELECT identifier FROM placeholders WHERE install_type = ?"
        " AND identifier NOT IN (SELECT identifier FROM coordinators)");
    rows.bind(static_cast<std::uint64_t>(kInstallTypeRestore));
    std::vector<std::string> identifiers;
    while (rows.next()) identifiers.push_back(rows.text(0));
    if (Status status = rows.status(); !status) return status.error();
    return identifiers;
}

Status leaveToStore(Database& database, const std::string& identifier) {
    StoredCoordinator coordinator;
    const Result<std::int64_t> id =
        insertCoordinator(database, identifier, CoordinatorKind::Restoring, SyncClientID);
    if (!id) return id.error();
    coordinator.id = *id;
    coordinator.responsible = AppStoreClientID;
    coordinator.placeholder = PlaceholderState::Stands;
    const Result<bool> updated = updateCoordinator(database, coordinator);
    return updated ? Status() : Status(updated.error());
}

Status takeOverRestored(Database& database) {
    const Result<std::vector<std::string>> restored = restoredWithoutCoordinator(database);
    if (!restored) return restored.error();
    for (const std::string& identifier : *restored) {
        if (Status left = leaveToStore(database, identifier); !left) return left;
    }
    // Nobody sends the data of a restore where installs are coordinated.
    return database.query("DELETE FROM restore_data").run();
}

Status reconcile(Database& database, Freed& freed) {
    freed.clear();
    // Nobody is there who could want to hear of these.
    if (Status gone = database.query("DELETE FROM cancellations").run(); !gone) return gone;
    const Result<bool> coordinated = isCoordinated(database);
    if (!coordinated) return coordinated.error();
    if (!*coordinated) return forgetAll(database, freed);
    Status status = forgetWithoutPlaceholder(database);
    if (status) status = forgetWithoutCoordinator(database, freed);
    return status ? takeOverRestored(database) : status;
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
