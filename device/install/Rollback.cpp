#include "device/install/Rollback.h"

#include <cerrno>
#include <optional>
#include <string>

#include "device/database/CoordinationTables.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/KeptTable.h"
#include "device/database/RegistryTables.h"
#include "device/install/Containers.h"
#include "device/install/DurabilityBarrier.h"
#include "device/install/InstallContext.h"
#include "device/install/KeptBundles.h"
#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "device/values/WallClock.h"
#include "platform/AppRegistry.h"
#include "platform/PropertyListSerialization.h"
#include "system/PosixError.h"
#include "system/RootDirectory.h"
#include "system/RootedFileSystem.h"

namespace appsync {

namespace {

/// The two versions that change places.
struct Versions {
    BundleRow installed;
    BundleRow kept;
};

ErrorRecord nothingKept(const std::string& identifier) {
    return registryError(
        RegistryErrorCode::NothingKept,
        "no earlier version of " + identifier + " is kept; put one into a library, and sync that");
}

ErrorRecord keptIsGone(const std::string& identifier, std::string_view what) {
    return registryError(RegistryErrorCode::NothingKept,
                         "the earlier version of " + identifier + " that was kept " +
                             std::string(what) + "; put one into a library, and sync that");
}

Status refuseWhileItRuns(Database& database, const std::string& identifier) {
    Query rows = database.query("SELECT 1 FROM running WHERE identifier = ?");
    rows.bind(identifier);
    if (!rows.next()) return rows.status();
    return registryError(RegistryErrorCode::Running,
                         identifier + " is running; quit it (appsync quit DEVICE " + identifier +
                             "), and roll it back then");
}

Status refuseUnderPlaceholder(Database& database, const std::string& identifier,
                              bool isInstalledToo) {
    const auto covering = findBundle(database, BundleTable::Placeholders, identifier);
    if (!covering) return covering.error();
    if (!isInstalledToo) {
        return registryError(RegistryErrorCode::NothingInstalled,
                             identifier + (*covering ? " is a placeholder, which has no version to "
                                                       "go back to; install it first"
                                                     : " is not installed; appsync apps DEVICE "
                                                       "shows what is"));
    }
    const auto coordinator = findCoordinator(database, identifier);
    if (!coordinator) return coordinator.error();
    if (!*covering && !*coordinator) return {};
    return registryError(RegistryErrorCode::UpdateUnderWay,
                         "an update of " + identifier +
                             " is under way; let a sync finish it, and roll it back then");
}

Status findVersions(Database& database, const std::string& identifier, Versions& versions) {
    auto installed = findBundle(database, BundleTable::Applications, identifier);
    if (!installed) return installed.error();
    Status status = refuseUnderPlaceholder(database, identifier, installed->has_value());
    if (status) status = refuseWhileItRuns(database, identifier);
    if (!status) return status;
    auto kept = findKept(database, identifier);
    if (!kept) return kept.error();
    if (!*kept) return nothingKept(identifier);
    versions = {**std::move(installed), **std::move(kept)};
    return {};
}

std::string shownVersion(const BundleRow& row) { return row.version.value_or("-"); }

Status noteRollback(Database& database, const Versions& versions) {
    return database
        .query(
            "INSERT INTO history (time, kind, scenario, step, party, phase, success,"
            " identifier, description) VALUES (?, 1, 'Rollback', 0, 0, 0, 1, ?, ?)")
        .bind(milliseconds(wallNow()), versions.installed.identifier,
              "Rolled back from " + shownVersion(versions.installed) + " to " +
                  shownVersion(versions.kept))
        .run();
}

// The kept container is with the others now; no row but that of the kept ones names it yet.
Status commitRollback(const InstallContext& context, const Versions& versions) {
    const std::string& identifier = versions.installed.identifier;
    return context.database.change(Durability::OnDisk, [&](Database& database) -> Status {
        Versions now;
        Status status = findVersions(database, identifier, now);
        // Only a removal can have come between.
        if (status && now.kept.container != versions.kept.container) return nothingKept(identifier);
        if (status) status = exchangeWithKept(database, now.installed, now.kept);
        return status ? noteRollback(database, now) : status;
    });
}

/// What is wrong with a bundle that cannot be used any more; nothing with any other.
std::optional<std::string> defectOf(const InstallContext& context, const BundleRow& kept) {
    const std::string bundle = containerPath(kept.container) + "/" + kept.bundle;
    const std::string infoName("Info.plist");
    const Result<Bytes> bytes = context.files.readFile(bundle + "/" + infoName);
    if (!bytes) return "its " + infoName + " cannot be read";
    const Result<PropertyList> info = context.propertyLists.parse(*bytes);
    const std::string* identifier = info ? info->findString(BundleIdentifierKey) : nullptr;
    if (identifier != nullptr && *identifier == kept.identifier) return std::nullopt;
    return "its " + infoName + " is damaged";
}

Status checkWhole(const InstallContext& context, const BundleRow& kept) {
    const std::string container = containerPath(kept.container);
    if (!isSingleName(kept.bundle)) return posixError(ENOENT, "open", container);
    const auto bundle =
        context.files.root().openDirectoryWithoutLinks(container + "/" + kept.bundle);
    if (!bundle) return bundle.error();
    const std::optional<std::string> defect = defectOf(context, kept);
    return defect ? Status(keptIsGone(kept.identifier, "is damaged: " + *defect)) : Status();
}

bool isMissing(const ErrorRecord& error) {
    if (error.domain != kPosixErrorDomain) return false;
    return error.code == ENOENT || error.code == ENOTDIR || error.code == ELOOP;
}

// Somebody has taken it away, or something of it.
ErrorRecord forgetMissing(const InstallContext& context, const BundleRow& kept,
                          std::string_view what) {
    context.database
        .change(Durability::Soon,
                [&](Database& database) { return forgetKept(database, kept.container); })
        .ignore();
    return keptIsGone(kept.identifier, what);
}

// Whether it lies with the containers of bundles, and is nobody's.
bool isStray(const InstallContext& context, const std::string& container) {
    if (!isSingleName(container)) return false;
    bool isRecorded = true;
    const Status read = context.database.read([&](Database& database) {
        Query rows = database.query(
            "SELECT 1 FROM applications WHERE container = ?1"
            " UNION ALL SELECT 1 FROM placeholders WHERE container = ?1");
        rows.bind(container);
        isRecorded = rows.next();
        return rows.status();
    });
    return read && !isRecorded && context.files.itemExists(containerPath(container));
}

// It lies with the others already where it could not be put away.
Status bringBack(const InstallContext& context, const BundleRow& kept) {
    Status moved = context.kept.bringBack(kept.container);
    if (moved || !isMissing(moved.error())) return moved;
    if (isStray(context, kept.container)) return {};
    return forgetMissing(context, kept, "is gone from the disk");
}

// Its files were durable before it was installed; that they are in their place again is not yet.
Status bringBackDurably(const InstallContext& context, const BundleRow& kept) {
    if (Status status = bringBack(context, kept); !status) return status;
    Status placed = checkWhole(context, kept);
    if (placed) placed = context.barrier.pass();
    if (placed) return {};
    context.kept.keep(kept.container).ignore();
    if (!isMissing(placed.error())) return placed;
    context.kept.remove(kept.container);
    return forgetMissing(context, kept, "is gone from the disk");
}

}  // namespace

Result<RollbackRecord> rollBackApplication(const InstallContext& context,
                                           const std::string& identifier) {
    Versions versions;
    const Status found = context.database.read(
        [&](Database& database) { return findVersions(database, identifier, versions); });
    if (!found) return asRegistryStatus(found).error();
    if (Status status = bringBackDurably(context, versions.kept); !status) return status.error();
    const Status committed = commitRollback(context, versions);
    // What cannot be put away is put in order by the next session.
    context.kept.keep((committed ? versions.installed : versions.kept).container).ignore();
    if (!committed) return asRegistryStatus(committed).error();
    return RollbackRecord{versions.installed.version, versions.kept.version};
}

}  // namespace appsync
