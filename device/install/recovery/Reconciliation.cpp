#include "device/install/recovery/Reconciliation.h"

#include <unistd.h>

#include <algorithm>
#include <optional>
#include <unordered_set>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/KeptTable.h"
#include "device/database/RegistryTables.h"
#include "device/database/SumTable.h"
#include "device/install/Containers.h"
#include "device/install/DurabilityBarrier.h"
#include "device/install/InstallContext.h"
#include "device/install/KeptBundles.h"
#include "device/install/RestoreData.h"
#include "device/install/recovery/CoordinationRecovery.h"
#include "device/values/DevicePaths.h"
#include "device/values/PackageIdentifier.h"
#include "device/values/WallClock.h"
#include "platform/InstallProgressRecord.h"
#include "system/file/PosixError.h"
#include "system/file/RootDirectory.h"
#include "system/file/RootedFileSystem.h"
#include "system/file/TemporaryFile.h"

namespace appsync {

namespace {

constexpr std::int64_t kKeptHistory = 100'000;

/// An identifier and the container of its record.
struct Holding {
    std::string identifier;
    std::string container;
};

Result<std::vector<Holding>> holdingsOf(Database& database, BundleTable table) {
    Query rows = database.query(table == BundleTable::Applications
                                    ? "SELECT identifier, container FROM applications"
                                    : "SELECT identifier, container FROM placeholders");
    std::vector<Holding> holdings;
    while (rows.next()) holdings.push_back({rows.text(0), rows.text(1)});
    if (Status status = rows.status(); !status) return status.error();
    return holdings;
}

// The files of a placeholder that another boot did not sync may be anything.
Status forgetUnsynced(Database& database, const std::string& boot) {
    return database.query("DELETE FROM placeholders WHERE unsynced_boot <> ?").bind(boot).run();
}

// Nothing is at work on an install when a session begins.
Status resetProgress(Database& database) {
    Status status =
        database.query("UPDATE progress SET state = ? WHERE state = ?")
            .bind(std::uint64_t{kInstallStateWaiting}, std::uint64_t{kInstallStateActive})
            .run();
    if (!status) return status;
    return database.query("UPDATE progress SET phase = ?, unpacked = 0 WHERE phase = ?")
        .bind(std::uint64_t{kInstallPhaseLoading}, std::uint64_t{kInstallPhaseInstalling})
        .run();
}

Status forgetAssertions(Database& database) {
    if (Status status = database.query("DELETE FROM assertions").run(); !status) return status;
    return database.query("DELETE FROM denials").run();
}

Status trimHistory(Database& database) {
    return database
        .query("DELETE FROM history WHERE id <= (SELECT coalesce(max(id), 0) FROM history) - ?")
        .bind(kKeptHistory)
        .run();
}

Status tidyTables(Database& database, const std::string& boot) {
    Status status = forgetUnsynced(database, boot);
    if (status) status = resetProgress(database);
    if (status) status = forgetAssertions(database);
    if (status) status = trimHistory(database);
    return status;
}

Status noteLost(Database& database, const std::string& identifier) {
    return database
        .query(
            "INSERT INTO history (time, kind, scenario, step, party, phase, success,"
            " identifier, description)"
            " VALUES (?, 1, 'Device start', 0, 0, 0, 0, ?, 'Bundle missing on disk')")
        .bind(milliseconds(wallNow()), identifier)
        .run();
}

/// The versions that are kept for a rollback, after the records of all others.
class KeptComparison {
  public:
    KeptComparison(const InstallContext& context, const std::unordered_set<std::string>& bundles,
                   std::unordered_set<std::string>& recorded)
        : context_(context), bundles_(bundles), recorded_(recorded) {}

    Status run() {
        if (Status status = gather(); !status) return status;
        std::vector<std::string> lost;
        for (const std::string& container : kept_) {
            if (onDisk_.erase(container) == 0 && !putInPlace(container)) lost.push_back(container);
        }
        for (const std::string& name : onDisk_) context_.kept.remove(name);
        if (lost.empty()) return {};
        return context_.database.change(Durability::Soon, [&](Database& database) -> Status {
            for (const std::string& container : lost) {
                if (Status status = forgetKept(database, container); !status) return status;
            }
            return {};
        });
    }

  private:
    Status gather() {
        const Result<std::vector<std::string>> names = context_.kept.names();
        if (!names) return names.error();
        onDisk_.insert(names->begin(), names->end());
        return context_.database.read([this](Database& database) -> Status {
            const Result<std::vector<BundleRow>> rows = allKept(database);
            if (!rows) return rows.error();
            for (const BundleRow& row : *rows) kept_.push_back(row.container);
            return {};
        });
    }

    // Whoever was to put it there did not come to that. Where it cannot be put there now either, it
    // is kept where it lies.
    bool putInPlace(const std::string& container) {
        if (!bundles_.contains(container) || recorded_.contains(container)) return false;
        const Status kept = context_.kept.keep(container);
        if (!kept && isInTheWay(kept.error())) return false;
        if (!kept) recorded_.insert(container);
        return true;
    }

    const InstallContext& context_;
    const std::unordered_set<std::string>& bundles_;
    std::unordered_set<std::string>& recorded_;
    std::unordered_set<std::string> onDisk_;
    std::vector<std::string> kept_;
};

/// What database and disk hold, and what of it fits together.
class Comparison {
  public:
    explicit Comparison(const InstallContext& context) : context_(context) {}

    Status run() {
        if (Status status = gather(); !status) return status;
        if (Status status = forgetLostRecords(); !status) return status;
        if (Status status = KeptComparison(context_, onDisk_, recorded_).run(); !status) {
            return status;
        }
        for (const std::string& name : onDisk_) {
            if (!recorded_.contains(name)) context_.containers.remove(name);
        }
        return {};
    }

    [[nodiscard]] std::vector<std::string> takeNotes() { return std::move(notes_); }

  private:
    Status gather() {
        Result<std::vector<std::string>> names = context_.containers.names();
        if (!names) return names.error();
        onDisk_.insert(names->begin(), names->end());
        return context_.database.read([this](Database& database) -> Status {
            Status status = compare(database, BundleTable::Applications, lostApplications_);
            if (!status) return status;
            return compare(database, BundleTable::Placeholders, lostPlaceholders_);
        });
    }

    Status compare(Database& database, BundleTable table, std::vector<std::string>& lost) {
        const Result<std::vector<Holding>> holdings = holdingsOf(database, table);
        if (!holdings) return holdings.error();
        for (const Holding& holding : *holdings) {
            recorded_.insert(holding.container);
            if (!onDisk_.contains(holding.container)) lost.push_back(holding.identifier);
        }
        return {};
    }

    Status forgetLostRecords() {
        if (lostApplications_.empty() && lostPlaceholders_.empty()) return {};
        for (const std::string& identifier : lostApplications_) {
            notes_.push_back("the bundle of " + identifier +
                             " is missing on disk, so the application is no longer installed; "
                             "sync it again");
        }
        return context_.database.change(Durability::OnDisk,
                                        [this](Database& database) { return forgetIn(database); });
    }

    Status forgetIn(Database& database) {
        std::string container;
        FreedContainers freed;
        for (const std::string& identifier : lostPlaceholders_) {
            const Status status = forgetPlaceholder(database, identifier, container);
            if (!status) return status;
        }
        for (const std::string& identifier : lostApplications_) {
            Status status = forgetApplication(database, identifier, freed);
            if (status) status = noteLost(database, identifier);
            if (!status) return status;
        }
        return {};
    }

    const InstallContext& context_;
    std::unordered_set<std::string> onDisk_;
    std::unordered_set<std::string> recorded_;
    std::vector<std::string> lostApplications_;
    std::vector<std::string> lostPlaceholders_;
    std::vector<std::string> notes_;
};

std::vector<std::string> namesAt(const InstallContext& context, std::string_view directory) {
    const std::string path(directory);
    const Result<UniqueFd> opened = context.files.root().openDirectoryWithoutLinks(path, "list");
    if (!opened) return {};
    Result<std::vector<std::string>> names = namesIn(opened->get(), path);
    return names ? std::move(*names) : std::vector<std::string>();
}

Result<std::unordered_set<std::string>> identifiersWithRestoreData(const InstallContext& context) {
    std::unordered_set<std::string> identifiers;
    const Status status = context.database.read([&](Database& database) {
        Query rows = database.query("SELECT identifier FROM restore_data");
        while (rows.next()) identifiers.insert(rows.text(0));
        return rows.status();
    });
    if (!status) return status.error();
    return identifiers;
}

}  // namespace

void clearPackages(const InstallContext& context) {
    const auto waiting = identifiersWithRestoreData(context);
    const auto delivered = deliveredFiles(context);
    if (!waiting || !delivered) return;  // nobody knows what is waited for
    const std::string directory(kPublicStagingDirectory);
    context.files
        .removeContents(directory,
                        [&](const std::string& name) {
                            const std::optional<std::string> identifier = identifierOfArchive(name);
                            return identifier && !waiting->contains(*identifier) &&
                                   !delivered->contains(directory + "/" + name);
                        })
        .ignore();
}

namespace {

// Data that was restored with an install is not restored again with the next one. What is no whole
// archive was cut off.
void clearRestoredData(const InstallContext& context) {
    const auto isNoArchive = [](const std::string& name) { return !identifierOfArchive(name); };
    context.files.removeContents(std::string(kRestoreDataDirectory), isNoArchive).ignore();
    for (const std::string& name : namesAt(context, kRestoreDataDirectory)) {
        const std::optional<std::string> identifier = identifierOfArchive(name);
        if (!identifier) continue;
        bool isInstalled = false;
        context.database
            .read([&](Database& database) -> Status {
                const auto row = findBundle(database, BundleTable::Applications, *identifier);
                if (!row) return row.error();
                isInstalled = row->has_value();
                return {};
            })
            .ignore();
        if (isInstalled) dropRestoredData(context, *identifier);
    }
}

void remakeDirectories(const InstallContext& context) {
    for (const std::string_view directory : kStandingDirectories) {
        context.files.createDirectory(std::string(directory), true, nullptr).ignore();
    }
}

bool wasInterrupted(const InstallContext& context) {
    bool interrupted = true;
    context.database
        .read([&](Database& database) -> Status {
            const Result<std::int64_t> sessions = database.integer("SELECT count(*) FROM session");
            if (!sessions) return sessions.error();
            interrupted = *sessions != 0;
            return {};
        })
        .ignore();
    return interrupted;
}

// Of the store metadata that was being written. There may be thousands of bundles: they are only
// looked at where a session has not ended.
void clearTemporariesOfBundles(const InstallContext& context) {
    if (!wasInterrupted(context)) return;
    const Result<std::vector<std::string>> containers = context.containers.names();
    if (!containers) return;
    for (const std::string& container : *containers) {
        context.files.removeContents(containerPath(container), isTemporaryName).ignore();
    }
}

void clearTemporaries(const InstallContext& context) {
    const auto all = [](const std::string&) { return true; };
    context.files.removeContents(std::string(kTemporaryDirectory), all).ignore();
    for (const std::string_view directory :
         {kWorkAreaDirectory, kPublicStagingDirectory, kPreferencesDirectory, kRestoreDirectory,
          kRestoreLogDirectory}) {
        context.files.removeStaleTemporaries(std::string(directory)).ignore();
    }
    clearTemporariesOfBundles(context);
}

}  // namespace

Result<std::vector<std::string>> reconcileDevice(const InstallContext& context) {
    const Status tidied = context.database.change(
        Durability::Soon, [&](Database& database) { return tidyTables(database, context.boot); });
    if (!tidied) return tidied.error();
    Comparison comparison(context);
    if (Status status = comparison.run(); !status) return status.error();
    if (Status status = reconcileCoordinators(context); !status) return status.error();
    remakeDirectories(context);
    clearPackages(context);
    clearRestoredData(context);
    clearTemporaries(context);
    return comparison.takeNotes();
}

Status beginSession(const InstallContext& context) {
    // The next session has to know of it, whatever ends this one.
    return context.database.change(Durability::OnDisk, [](Database& database) {
        return database
            .query(
                "INSERT OR REPLACE INTO session (id, process, started, last_uninstall)"
                " VALUES (1, ?, ?, (SELECT coalesce(max(id), 0) FROM uninstalled))")
            .bind(std::int64_t{::getpid()}, milliseconds(wallNow()))
            .run();
    });
}

Status endSession(const InstallContext& context) {
    std::int64_t unsynced = 0;
    Status status = context.database.read([&](Database& database) {
        Query rows =
            database.query("SELECT count(*) FROM placeholders WHERE unsynced_boot IS NOT NULL");
        if (rows.next()) unsynced = rows.integer(0);
        return rows.status();
    });
    if (status && unsynced > 0) status = context.barrier.pass();
    if (!status) return status;
    return context.database.change(Durability::OnDisk, [](Database& database) -> Status {
        Query synced = database.query(
            "UPDATE placeholders SET unsynced_boot = NULL WHERE unsynced_boot IS NOT NULL");
        if (Status marked = synced.run(); !marked) return marked;
        if (Status tidied = forgetOldSums(database); !tidied) return tidied;
        return database.query("DELETE FROM session").run();
    });
}

}  // namespace appsync
