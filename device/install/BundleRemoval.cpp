#include "device/install/BundleRemoval.h"

#include "device/database/CoordinationTables.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/RegistryTables.h"
#include "device/install/Containers.h"
#include "device/install/InstallContext.h"
#include "device/install/KeptBundles.h"
#include "device/install/ProgressBook.h"
#include "device/install/RestoreData.h"
#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "device/values/WallClock.h"
#include "system/file/RootedFileSystem.h"

namespace appsync {

namespace {

/// What a removal found, and what it leaves to be done once it is committed.
struct RemovalOutcome {
    std::optional<BundleRow> application;
    std::optional<BundleRow> placeholder;
    bool removedApplication = false;
    bool removedPlaceholder = false;
    FreedContainers freed;

    [[nodiscard]] bool nothingRemains() const {
        return (removedApplication || !application) && (removedPlaceholder || !placeholder);
    }
    [[nodiscard]] bool dataGoes() const {
        if (!nothingRemains()) return false;
        return removedApplication || placeholder->installType != kInstallTypeSync;
    }
};

Status find(Database& database, const std::string& identifier, RemovalOutcome& outcome) {
    auto application = findBundle(database, BundleTable::Applications, identifier);
    if (!application) return application.error();
    outcome.application = std::move(*application);
    auto placeholder = findBundle(database, BundleTable::Placeholders, identifier);
    if (!placeholder) return placeholder.error();
    outcome.placeholder = std::move(*placeholder);
    return {};
}

const char* nothingToRemove(Removal removal) {
    switch (removal) {
        case Removal::PlaceholderOnly:
            return " has no placeholder to remove";
        case Removal::SyncPlaceholderOnly:
            return " has no placeholder of the install that failed";
        default:
            return " is not installed; appsync apps shows what is";
    }
}

// Decides what goes. An error when that is nothing.
Status decide(const std::string& identifier, Removal removal, RemovalOutcome& outcome) {
    outcome.removedPlaceholder =
        outcome.placeholder && (removal != Removal::SyncPlaceholderOnly ||
                                outcome.placeholder->installType == kInstallTypeSync);
    const bool applicationToo =
        removal == Removal::Everything ||
        (removal == Removal::PlaceholderFirst && !outcome.removedPlaceholder);
    outcome.removedApplication = applicationToo && outcome.application.has_value();
    if (outcome.removedApplication && outcome.application->type == kApplicationTypeSystem) {
        return registryError(RegistryErrorCode::SystemApplication,
                             identifier + " is a system application and cannot be removed");
    }
    if (outcome.removedApplication || outcome.removedPlaceholder) return {};
    return registryError(RegistryErrorCode::NothingInstalled,
                         identifier + nothingToRemove(removal));
}

Status runFor(Database& database, const char* sql, const std::string& identifier) {
    return database.query(sql).bind(identifier).run();
}

Status noteUninstalled(Database& database, const std::string& identifier,
                       const RemovalOutcome& outcome) {
    const std::optional<BundleRow>& row =
        outcome.application ? outcome.application : outcome.placeholder;
    return database
        .query("INSERT OR REPLACE INTO uninstalled (identifier, version, time) VALUES (?, ?, ?)")
        .bind(identifier, row->version, milliseconds(wallNow()))
        .run();
}

Status forget(Database& database, const std::string& identifier, RemovalOutcome& outcome) {
    Status status;
    if (outcome.removedPlaceholder) {
        status = forgetPlaceholder(database, identifier, outcome.freed.placeholder);
    }
    if (status && outcome.removedApplication) {
        status = forgetApplication(database, identifier, outcome.freed);
    }
    // An install that was to put something here is over, too.
    if (status) status = cancelForRemoval(database, identifier);
    if (!status || !outcome.nothingRemains()) return status;
    status = runFor(database, "DELETE FROM denials WHERE identifier = ?", identifier);
    if (!status) return status;
    return runFor(database, "DELETE FROM restore_data WHERE identifier = ?", identifier);
}

Status removeRows(Database& database, const std::string& identifier, Removal removal,
                  RemovalOutcome& outcome) {
    outcome = {};
    Status status = find(database, identifier, outcome);
    if (status) status = decide(identifier, removal, outcome);
    if (status) status = forget(database, identifier, outcome);
    if (!status || removal != Removal::Everything) return status;
    status = runFor(database, "DELETE FROM failures WHERE identifier = ?", identifier);
    return status ? noteUninstalled(database, identifier, outcome) : status;
}

}  // namespace

Status removeBundles(const InstallContext& context, const std::string& identifier,
                     Removal removal) {
    RemovalOutcome outcome;
    const Status committed = context.database.change(Durability::OnDisk, [&](Database& database) {
        return removeRows(database, identifier, removal, outcome);
    });
    if (!committed) return asRegistryStatus(committed);
    if (outcome.removedPlaceholder) context.progress.forget(identifier, kInstallStateCanceled);
    putAway(context, outcome.freed);
    if (outcome.dataGoes()) {
        const bool isKept = context.keepsData && removal != Removal::Everything;
        if (!isKept) context.files.removeItem(dataDirectoryOf(identifier)).ignore();
        dropRestoredData(context, identifier);
    }
    return {};
}

Result<std::vector<std::string>> removeSyncPlaceholders(const InstallContext& context) {
    std::vector<std::string> identifiers;
    std::vector<std::string> containers;
    const Status committed = context.database.change(Durability::OnDisk, [&](Database& database) {
        Query rows = database.query(
            "DELETE FROM placeholders WHERE install_type = ? AND identifier NOT IN"
            " (SELECT identifier FROM coordinators) RETURNING identifier, container");
        rows.bind(static_cast<std::uint64_t>(kInstallTypeSync));
        while (rows.next()) {
            identifiers.push_back(rows.text(0));
            containers.push_back(rows.text(1));
        }
        return rows.status();
    });
    if (!committed) return committed.error();
    for (const std::string& identifier : identifiers) {
        context.progress.forget(identifier, kInstallStateCanceled);
    }
    for (const std::string& container : containers) context.containers.remove(container);
    return identifiers;
}

std::string dataDirectoryOf(const std::string& identifier) {
    return std::string(kDataDirectory) + "/" + identifier;
}

}  // namespace appsync
