#include "device/install/recovery/Rollback.h"

#include <cerrno>
#include <optional>
#include <string>

#include "device/database/CoordinationTables.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/KeptTable.h"
#include "device/database/RegistryTables.h"
#include "device/database/SumTable.h"
#include "device/install/Containers.h"
#include "device/install/DurabilityBarrier.h"
#include "device/install/InstallContext.h"
#include "device/install/KeptBundles.h"
#include "device/install/UpdateUnderWay.h"
#include "device/package/BundleSum.h"
#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "device/values/WallClock.h"
#include "platform/AppRegistry.h"
#include "platform/PropertyListSerialization.h"
#include "system/file/PosixError.h"
#include "system/file/RootDirectory.h"
#include "system/file/RootedFileSystem.h"

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

constexpr std::string_view kGone = "is gone from the disk";
constexpr std::string_view kDamaged =
    "is damaged, as its files are not those that were installed, and is kept no more";

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
    return updateIsUnderWay(identifier, *coordinator, "roll it back");
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

bool isMissing(const ErrorRecord& error) {
    if (error.domain != kPosixErrorDomain) return false;
    return error.code == ENOENT || error.code == ENOTDIR || error.code == ELOOP;
}

Result<std::optional<std::uint64_t>> recordedSum(const InstallContext& context,
                                                 const std::string& container) {
    std::optional<std::uint64_t> sum;
    const Status read = context.database.read([&](Database& database) -> Status {
        const auto found = findSum(database, container);
        if (!found) return found.error();
        sum = *found;
        return {};
    });
    if (!read) return read.error();
    return sum;
}

/// Whether its Info.plist is there, and is that of the application.
Result<bool> hasInfo(const InstallContext& context, const std::string& bundle,
                     const std::string& identifier) {
    const Result<Bytes> bytes = context.files.readFile(bundle + "/Info.plist");
    if (!bytes && isMissing(bytes.error())) return false;
    if (!bytes) return bytes.error();
    const Result<PropertyList> info = context.propertyLists.parse(*bytes);
    const std::string* found = info ? info->findString(BundleIdentifierKey) : nullptr;
    return found != nullptr && *found == identifier;
}

/// Whether the bundle is as it was unpacked. Where nobody has recorded that, whether it is the
/// application at all.
Result<bool> isAsInstalled(const InstallContext& context, const BundleRow& kept,
                           const std::string& bundle) {
    const auto recorded = recordedSum(context, kept.container);
    if (!recorded) return recorded.error();
    if (!*recorded) return hasInfo(context, bundle, kept.identifier);
    const Result<std::uint64_t> sum = sumOfBundle(context.files.root(), bundle);
    if (!sum) return sum.error();
    return *sum == **recorded;
}

Status checkWhole(const InstallContext& context, const BundleRow& kept) {
    const std::string container = containerPath(kept.container);
    if (!isSingleName(kept.bundle)) return posixError(ENOENT, "open", container);
    const std::string bundle = container + "/" + kept.bundle;
    const auto opened = context.files.root().openDirectoryWithoutLinks(bundle);
    if (!opened) return opened.error();
    const Result<bool> isWhole = isAsInstalled(context, kept, bundle);
    if (!isWhole) return isWhole.error();
    return *isWhole ? Status() : Status(keptIsGone(kept.identifier, kDamaged));
}

void forgetRecord(const InstallContext& context, const BundleRow& kept) {
    context.database
        .change(Durability::Soon,
                [&](Database& database) { return forgetKept(database, kept.container); })
        .ignore();
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
    forgetRecord(context, kept);
    return keptIsGone(kept.identifier, kGone);
}

// Its files were durable before it was installed; that they are in their place again is not yet.
Status bringBackDurably(const InstallContext& context, const BundleRow& kept) {
    if (Status status = bringBack(context, kept); !status) return status;
    Status placed = checkWhole(context, kept);
    if (placed) placed = context.barrier.pass();
    if (placed) return {};
    context.kept.keep(kept.container).ignore();
    const bool isGone = isMissing(placed.error());
    if (!isGone && !isRegistryError(placed.error(), RegistryErrorCode::NothingKept)) return placed;
    context.kept.remove(kept.container);
    forgetRecord(context, kept);
    return isGone ? keptIsGone(kept.identifier, kGone) : placed;
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
