#include "device/database/CoordinationTables.h"

#include <algorithm>

#include "device/database/Database.h"
#include "device/database/RegistryTables.h"
#include "device/values/DeviceError.h"
#include "device/values/DeviceRecords.h"
#include "device/values/WallClock.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {

namespace {

constexpr double kPercentUnits = 1000;

/// Selects whole coordinators: one row for each promise, or one with nulls where there is none.
#define APPSYNC_SELECT_COORDINATORS                                                           \
    "SELECT c.id, c.identifier, c.kind, c.client, c.responsible IS NULL, c.responsible,"      \
    " c.options IS NULL, c.options, c.initial_assets, c.placeholder, p.role IS NULL, p.role," \
    " p.position, p.name, p.client, p.path, p.space, p.percent, p.complete, p.cancelled"      \
    " FROM coordinators c LEFT JOIN promises p ON p.coordinator = c.id"

StoredCoordinator readCoordinator(const Query& row) {
    StoredCoordinator coordinator;
    coordinator.id = row.integer(0);
    coordinator.identifier = row.text(1);
    coordinator.kind = static_cast<CoordinatorKind>(row.integer(2));
    coordinator.client = row.unsignedInteger(3);
    if (row.integer(4) == 0) coordinator.responsible = row.unsignedInteger(5);
    if (row.integer(6) == 0) coordinator.options = row.blob(7);
    coordinator.hasInitialAssets = row.integer(8) != 0;
    coordinator.placeholder = static_cast<PlaceholderState>(row.integer(9));
    return coordinator;
}

StoredPromise readPromise(const Query& row) {
    StoredPromise promise;
    promise.role = static_cast<PromiseRole>(row.integer(11));
    promise.position = row.integer(12);
    promise.values.name = row.text(13);
    promise.values.client = row.unsignedInteger(14);
    promise.values.path = row.optionalText(15);
    promise.values.diskSpaceNeeded = row.unsignedInteger(16);
    promise.values.percent = static_cast<double>(row.integer(17)) / kPercentUnits;
    promise.values.complete = row.integer(18) != 0;
    promise.values.cancelled = row.integer(19) != 0;
    return promise;
}

Result<std::vector<StoredCoordinator>> readCoordinators(Query rows) {
    std::vector<StoredCoordinator> all;
    while (rows.next()) {
        if (all.empty() || all.back().id != rows.integer(0)) all.push_back(readCoordinator(rows));
        if (rows.integer(10) == 0) all.back().promises.push_back(readPromise(rows));
    }
    if (Status status = rows.status(); !status) return status.error();
    return all;
}

PromiseRecord recordOf(const PromiseValues& values) {
    return {values.name, values.complete, values.percent, values.client, values.cancelled};
}

bool isThere(const PromiseValues* promise) { return promise != nullptr && !promise->cancelled; }

std::optional<MissingPiece> notKept(const PromiseValues& promise, std::string_view what) {
    if (promise.complete || promise.cancelled) return std::nullopt;
    return MissingPiece{"client " + std::to_string(promise.client) + " has yet to deliver " +
                            std::string(what) + " (" + promise.name + ")",
                        promise.client};
}

std::string_view thing(PromiseRole role) {
    switch (role) {
        case PromiseRole::Asset:
            return "the package";
        case PromiseRole::UserData:
            return "the user data";
        case PromiseRole::InitialAsset:
            break;
    }
    return "an initial asset";
}

std::optional<MissingPiece> missingPackage(const StoredCoordinator& coordinator) {
    if (coordinator.kind == CoordinatorKind::RestoringDemoted) return std::nullopt;
    if (isThere(coordinator.promise(PromiseRole::Asset))) return std::nullopt;
    if (!coordinator.responsible) return MissingPiece{"nobody has promised the package yet", {}};
    return MissingPiece{
        "client " + std::to_string(*coordinator.responsible) + " has yet to promise the package",
        coordinator.responsible};
}

// What its creator has to hand in.
std::optional<MissingPiece> missingFromCreator(const StoredCoordinator& coordinator) {
    const bool restoring = coordinator.kind == CoordinatorKind::Restoring ||
                           coordinator.kind == CoordinatorKind::RestoringDemoted;
    const char* what = nullptr;
    if (!restoring && !coordinator.options) what = "the install options";
    if (what == nullptr && !restoring && !coordinator.hasInitialAssets) {
        what = "the list of initial assets";
    }
    const bool demoted = coordinator.kind == CoordinatorKind::RestoringDemoted;
    if (what == nullptr && (coordinator.placeholder == PlaceholderState::None ||
                            (demoted && coordinator.placeholder == PlaceholderState::Kept))) {
        what = "the placeholder";
    }
    if (what == nullptr) return std::nullopt;
    return MissingPiece{
        "client " + std::to_string(coordinator.client) + " has yet to hand in " + what,
        coordinator.client};
}

}  // namespace

const PromiseValues* StoredCoordinator::promise(PromiseRole role) const {
    const auto found =
        std::find_if(promises.begin(), promises.end(),
                     [role](const StoredPromise& promise) { return promise.role == role; });
    return found == promises.end() ? nullptr : &found->values;
}

std::string nameOf(CoordinatorKind kind) {
    switch (kind) {
        case CoordinatorKind::Initiating:
            return "initiating";
        case CoordinatorKind::Updating:
            return "updating";
        case CoordinatorKind::Restoring:
            return "restoring";
        case CoordinatorKind::RestoringDemoted:
            return "restoring demoted";
    }
    return "unknown";
}

std::optional<MissingPiece> missingPiece(const StoredCoordinator& coordinator) {
    if (auto missing = missingFromCreator(coordinator)) return missing;
    if (auto missing = missingPackage(coordinator)) return missing;
    for (const StoredPromise& promise : coordinator.promises) {
        if (auto missing = notKept(promise.values, thing(promise.role))) return missing;
    }
    return std::nullopt;
}

CoordinatorRecord recordOf(const StoredCoordinator& coordinator) {
    CoordinatorRecord record;
    record.identifier = coordinator.identifier;
    record.kind = nameOf(coordinator.kind);
    record.client = coordinator.client;
    for (const StoredPromise& promise : coordinator.promises) {
        record.promises.push_back(recordOf(promise.values));
    }
    record.hasPlaceholder = coordinator.placeholder != PlaceholderState::None;
    record.placeholderStands = coordinator.placeholder == PlaceholderState::Stands ||
                               coordinator.placeholder == PlaceholderState::Borrowed;
    const std::optional<MissingPiece> missing = missingPiece(coordinator);
    record.isComplete = !missing.has_value();
    if (!missing) return record;
    record.waitsFor = missing->sentence;
    record.waitsForClient = missing->client;
    return record;
}

Result<std::optional<StoredCoordinator>> findCoordinator(Database& database,
                                                         const std::string& identifier) {
    Query rows = database.query(APPSYNC_SELECT_COORDINATORS
                                " WHERE c.identifier = ? ORDER BY p.role, p.position");
    rows.bind(identifier);
    Result<std::vector<StoredCoordinator>> found = readCoordinators(std::move(rows));
    if (!found) return found.error();
    if (found->empty()) return std::optional<StoredCoordinator>();
    return std::optional<StoredCoordinator>(std::move(found->front()));
}

Result<std::vector<StoredCoordinator>> allCoordinators(Database& database) {
    return readCoordinators(
        database.query(APPSYNC_SELECT_COORDINATORS " ORDER BY c.identifier, p.role, p.position"));
}

#undef APPSYNC_SELECT_COORDINATORS

Result<std::int64_t> insertCoordinator(Database& database, const std::string& identifier,
                                       CoordinatorKind kind, CoordinationClient client) {
    Query insert = database.query(
        "INSERT INTO coordinators (identifier, kind, client, created) VALUES (?, ?, ?, ?)"
        " RETURNING id");
    insert.bind(identifier, static_cast<std::int64_t>(kind), client, milliseconds(wallNow()));
    std::int64_t id = 0;
    while (insert.next()) id = insert.integer(0);
    if (Status status = insert.status(); !status) return status.error();
    return id;
}

Result<std::int64_t> reserveCoordinatorIds(Database& database, std::int64_t count) {
    const Status known = database
                             .query(
                                 "INSERT INTO sqlite_sequence (name, seq) SELECT 'coordinators', 0"
                                 " WHERE NOT EXISTS"
                                 " (SELECT 1 FROM sqlite_sequence WHERE name = 'coordinators')")
                             .run();
    if (!known) return known.error();
    Query reserve = database.query(
        "UPDATE sqlite_sequence SET seq = seq + ? WHERE name = 'coordinators' RETURNING seq");
    reserve.bind(count);
    std::int64_t last = 0;
    while (reserve.next()) last = reserve.integer(0);
    if (Status status = reserve.status(); !status) return status.error();
    return last - count + 1;
}

Result<bool> insertReserved(Database& database, const StoredCoordinator& coordinator) {
    const Status status =
        database
            .query(
                "INSERT INTO coordinators (id, identifier, kind, client, created, responsible,"
                " options, initial_assets, placeholder) VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?)"
                " ON CONFLICT (identifier) DO NOTHING")
            .bind(coordinator.id, coordinator.identifier,
                  static_cast<std::int64_t>(coordinator.kind), coordinator.client,
                  milliseconds(wallNow()), coordinator.responsible, coordinator.options,
                  coordinator.hasInitialAssets, static_cast<std::int64_t>(coordinator.placeholder))
            .run();
    if (!status) return status.error();
    return database.changedRows() > 0;
}

Result<bool> updateCoordinator(Database& database, const StoredCoordinator& coordinator) {
    const Status status =
        database
            .query(
                "UPDATE coordinators SET responsible = ?1, options = ?2, initial_assets = ?3,"
                " placeholder = iif(placeholder > ?4, placeholder, ?5) WHERE id = ?6")
            .bind(coordinator.responsible, coordinator.options, coordinator.hasInitialAssets,
                  static_cast<std::int64_t>(PlaceholderState::Kept),
                  static_cast<std::int64_t>(coordinator.placeholder), coordinator.id)
            .run();
    if (!status) return status.error();
    return database.changedRows() > 0;
}

Result<bool> storePlaceholderState(Database& database, std::int64_t id, PlaceholderState state) {
    const Status status = database.query("UPDATE coordinators SET placeholder = ? WHERE id = ?")
                              .bind(static_cast<std::int64_t>(state), id)
                              .run();
    if (!status) return status.error();
    return database.changedRows() > 0;
}

Status storePromise(Database& database, std::int64_t coordinator, const StoredPromise& promise) {
    const PromiseValues& values = promise.values;
    return database
        .query(
            "INSERT OR REPLACE INTO promises (coordinator, role, position, name, client, path,"
            " space, percent, complete, cancelled)"
            " SELECT id, ?, ?, ?, ?, ?, ?, ?, ?, ? FROM coordinators WHERE id = ?")
        .bind(static_cast<std::int64_t>(promise.role), promise.position, values.name, values.client,
              values.path, values.diskSpaceNeeded,
              static_cast<std::int64_t>(values.percent * kPercentUnits), values.complete,
              values.cancelled, coordinator)
        .run();
}

Result<bool> forgetCoordinator(Database& database, std::int64_t id) {
    const Status status = database.query("DELETE FROM coordinators WHERE id = ?").bind(id).run();
    if (!status) return status.error();
    return database.changedRows() > 0;
}

Status removeCoordinator(Database& database, std::int64_t id, RemovedCoordinator& removed) {
    removed = {};
    std::string identifier;
    PlaceholderState placeholder = PlaceholderState::None;
    {
        Query rows = database.query(
            "DELETE FROM coordinators WHERE id = ? RETURNING identifier, placeholder");
        rows.bind(id);
        while (rows.next()) {
            removed.existed = true;
            identifier = rows.text(0);
            placeholder = static_cast<PlaceholderState>(rows.integer(1));
        }
        if (Status status = rows.status(); !status) return status;
    }
    if (!removed.existed) return {};
    Status status =
        database.query("DELETE FROM denials WHERE identifier = ?").bind(identifier).run();
    if (!status || placeholder != PlaceholderState::Stands) return status;
    removed.hadPlaceholder = true;
    return forgetPlaceholder(database, identifier, removed.container);
}

Status renewRestore(Database& database, const StoredCoordinator& failed,
                    RemovedCoordinator& removed) {
    removed = {};
    const Result<bool> forgotten = forgetCoordinator(database, failed.id);
    if (!forgotten) return forgotten.error();
    removed.existed = *forgotten;
    if (!removed.existed) return {};
    Status status =
        database.query("DELETE FROM denials WHERE identifier = ?").bind(failed.identifier).run();
    if (!status) return status;
    const Result<std::int64_t> id =
        insertCoordinator(database, failed.identifier, failed.kind, failed.client);
    if (!id) return id.error();
    StoredCoordinator renewed = failed;
    renewed.id = *id;
    const Result<bool> updated = updateCoordinator(database, renewed);
    if (!updated) return updated.error();
    for (const StoredPromise& promise : failed.promises) {
        if (promise.role == PromiseRole::Asset) continue;  // its package is gone
        status = storePromise(database, renewed.id, promise);
        if (!status) return status;
    }
    return database
        .query(
            "UPDATE progress SET state = ?, phase = ?, completed = 0, unpacked = 0"
            " WHERE identifier = ?")
        .bind(static_cast<std::uint64_t>(kInstallStateWaiting),
              static_cast<std::uint64_t>(kInstallPhaseLoading), failed.identifier)
        .run();
}

Status announceCancellation(Database& database, const Cancellation& cancellation) {
    return database
        .query(
            "INSERT INTO cancellations (coordinator, identifier, client, domain, code,"
            " description) VALUES (?, ?, ?, ?, ?, ?)")
        .bind(cancellation.coordinator, cancellation.identifier, cancellation.client,
              cancellation.reason.domain, cancellation.reason.code,
              cancellation.reason.description())
        .run();
}

Result<std::vector<Cancellation>> cancellationsSince(Database& database, std::int64_t id) {
    Query rows = database.query(
        "SELECT id, coordinator, identifier, client, domain, code, description"
        " FROM cancellations WHERE id > ? ORDER BY id");
    rows.bind(id);
    std::vector<Cancellation> all;
    while (rows.next()) {
        all.push_back({rows.integer(0), rows.integer(1), rows.text(2), rows.unsignedInteger(3),
                       ErrorRecord::make(rows.text(4), rows.integer(5), rows.text(6))});
    }
    if (Status status = rows.status(); !status) return status.error();
    return all;
}

Result<bool> wasCancelled(Database& database, std::int64_t coordinator) {
    Query rows = database.query("SELECT 1 FROM cancellations WHERE coordinator = ?");
    rows.bind(coordinator);
    const bool found = rows.next();
    if (Status read = rows.status(); !read) return read.error();
    return found;
}

Status forgetCancellations(Database& database, std::int64_t upTo) {
    return database.query("DELETE FROM cancellations WHERE id <= ?").bind(upTo).run();
}

Status cancelForRemoval(Database& database, const std::string& identifier) {
    std::int64_t id = 0;
    {
        Query rows = database.query("DELETE FROM coordinators WHERE identifier = ? RETURNING id");
        rows.bind(identifier);
        while (rows.next()) id = rows.integer(0);
        if (Status status = rows.status(); !status) return status;
    }
    if (id == 0) return {};
    return announceCancellation(
        database, {0, id, identifier, 0,
                   coordinationError(CoordinationErrorCode::Cancelled,
                                     "the install of " + identifier +
                                         " was cancelled: it was removed from the device")});
}

}  // namespace appsync
