#include "device/DeviceQueries.h"

#include <algorithm>
#include <functional>
#include <unordered_map>
#include <utility>

#include "device/database/CoordinationTables.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/KeptTable.h"
#include "device/database/RegistryTables.h"
#include "device/install/ProgressBook.h"
#include "device/screen/IconDrawing.h"
#include "device/values/WallClock.h"
#include "system/file/DescriptorIO.h"
#include "system/file/RootDirectory.h"

namespace appsync {

namespace {

using ProgressByIdentifier = std::unordered_map<std::string, InstallProgress>;

Result<ProgressByIdentifier> allProgress(Database& database) {
    Query rows =
        database.query("SELECT identifier, state, phase, total, completed, unpacked FROM progress");
    ProgressByIdentifier all;
    while (rows.next()) all.insert_or_assign(rows.text(0), readProgress(rows, 1));
    if (Status status = rows.status(); !status) return status.error();
    return all;
}

Status appendRecords(Database& database, BundleTable table,
                     std::vector<ApplicationRecord>& records) {
    const Result<std::vector<BundleRow>> rows = allBundles(database, table);
    if (!rows) return rows.error();
    for (const BundleRow& row : *rows) records.push_back(recordOf(row, table));
    return {};
}

Status addProgress(Database& database, std::vector<ApplicationRecord>& records) {
    const Result<ProgressByIdentifier> progress = allProgress(database);
    if (!progress) return progress.error();
    for (ApplicationRecord& record : records) {
        const auto found = progress->find(record.identifier);
        if (record.isPlaceholder && found != progress->end()) record.progress = found->second;
    }
    return {};
}

Status addKept(Database& database, std::vector<ApplicationRecord>& records) {
    const Result<std::vector<BundleRow>> rows = allKept(database);
    if (!rows) return rows.error();
    std::unordered_map<std::string_view, const BundleRow*> kept;
    for (const BundleRow& row : *rows) kept[row.identifier] = &row;
    for (ApplicationRecord& record : records) {
        const auto found = kept.find(record.identifier);
        if (record.isPlaceholder || found == kept.end()) continue;
        record.kept = KeptVersion{found->second->version, found->second->bytes};
    }
    return {};
}

// Calls `take` with the one row that a statement finds for the identifier, if it does.
Status withRow(Database& database, const char* sql, const std::string& identifier,
               const std::function<void(const Query&)>& take) {
    Query rows = database.query(sql);
    rows.bind(identifier);
    if (rows.next()) take(rows);
    return rows.status();
}

Status findRecords(Database& database, const std::string& identifier, ApplicationStatus& status) {
    const auto application = findBundle(database, BundleTable::Applications, identifier);
    if (!application) return application.error();
    if (*application) status.installed = recordOf(**application, BundleTable::Applications);
    const auto placeholder = findBundle(database, BundleTable::Placeholders, identifier);
    if (!placeholder) return placeholder.error();
    if (!*placeholder) return {};
    status.placeholder = recordOf(**placeholder, BundleTable::Placeholders);
    const auto progress = loadProgress(database, identifier);
    if (!progress) return progress.error();
    status.placeholder->progress = *progress;
    return {};
}

Status findMarks(Database& database, const std::string& identifier, ApplicationStatus& status) {
    Status found = withRow(database, "SELECT 1 FROM running WHERE identifier = ?", identifier,
                           [&](const Query&) { status.isRunning = true; });
    if (found) {
        found = withRow(database, "SELECT 1 FROM assertions WHERE identifier = ?", identifier,
                        [&](const Query&) { status.isHeld = true; });
    }
    if (!found) return found;
    return withRow(database, "SELECT 1 FROM restore_data WHERE identifier = ?", identifier,
                   [&](const Query&) { status.awaitsRestoreData = true; });
}

InstallFailure failureOf(const Query& row) {
    return {wallTime(row.integer(0)), ErrorRecord::make(row.text(1), row.integer(2), row.text(3))};
}

Status findEvents(Database& database, const std::string& identifier, ApplicationStatus& status) {
    Status found = withRow(
        database, "SELECT time, next_try FROM denials WHERE identifier = ?", identifier,
        [&](const Query& row) {
            status.denial = TerminationDenial{wallTime(row.integer(0)), wallTime(row.integer(1))};
        });
    if (found) {
        found = withRow(database,
                        "SELECT time, domain, code, description FROM failures"
                        " WHERE identifier = ?",
                        identifier, [&](const Query& row) { status.lastFailure = failureOf(row); });
    }
    if (!found) return found;
    return withRow(database, "SELECT time FROM uninstalled WHERE identifier = ?", identifier,
                   [&](const Query& row) { status.uninstalled = wallTime(row.integer(0)); });
}

Status addLastFailure(Database& database, CoordinatorRecord& record) {
    return withRow(
        database, "SELECT time, domain, code, description FROM failures WHERE identifier = ?",
        record.identifier, [&](const Query& row) { record.error = failureOf(row).error; });
}

Status findCoordination(Database& database, const std::string& identifier,
                        ApplicationStatus& status) {
    const auto coordinator = findCoordinator(database, identifier);
    if (!coordinator) return coordinator.error();
    if (!*coordinator) return {};
    status.coordinator = recordOf(**coordinator);
    return addLastFailure(database, *status.coordinator);
}

Status findSession(Database& database, std::optional<std::int64_t>& process,
                   std::optional<WallTime>& since) {
    Query rows = database.query("SELECT process, started FROM session");
    if (rows.next()) {
        process = rows.integer(0);
        since = wallTime(rows.integer(1));
    }
    return rows.status();
}

// A session is noted after it has the lock, and its note goes before the lock.
SessionRecord sessionOf(std::optional<std::int64_t> process, std::optional<WallTime> since,
                        bool isUnderWay) {
    if (isUnderWay) return {true, process, since, false};
    return {false, std::nullopt, std::nullopt, process.has_value()};
}

// What is read sees nothing that others commit meanwhile.
Status atOneMoment(Database& database, const std::function<Status()>& reading) {
    if (database.inTransaction()) return reading();
    if (Status begun = database.execute("BEGIN"); !begun) return begun;
    Status read = reading();
    const Status ended = database.execute("COMMIT");
    return read ? ended : read;
}

using StatusByIdentifier = std::map<std::string, ApplicationStatus>;

// Calls `take` with each row whose first column is an identifier that is known.
Status withRows(Database& database, const char* sql, StatusByIdentifier& known,
                const std::function<void(ApplicationStatus&, const Query&)>& take) {
    Query rows = database.query(sql);
    while (rows.next()) {
        const auto found = known.find(rows.text(0));
        if (found != known.end()) take(found->second, rows);
    }
    return rows.status();
}

Status gatherRecords(Database& database, StatusByIdentifier& known) {
    std::vector<ApplicationRecord> records;
    Status read = appendRecords(database, BundleTable::Applications, records);
    if (read) read = appendRecords(database, BundleTable::Placeholders, records);
    if (read) read = addProgress(database, records);
    if (read) read = addKept(database, records);
    if (!read) return read;
    for (ApplicationRecord& record : records) {
        ApplicationStatus& status = known[record.identifier];
        (record.isPlaceholder ? status.placeholder : status.installed) = std::move(record);
    }
    return {};
}

Status gatherCoordinators(Database& database, StatusByIdentifier& known) {
    const auto coordinators = allCoordinators(database);
    if (!coordinators) return coordinators.error();
    for (const StoredCoordinator& each : *coordinators) {
        CoordinatorRecord record = recordOf(each);
        known[record.identifier].coordinator = std::move(record);
    }
    return {};
}

Status gatherMarks(Database& database, StatusByIdentifier& known) {
    Status read =
        withRows(database, "SELECT identifier FROM running", known,
                 [](ApplicationStatus& status, const Query&) { status.isRunning = true; });
    if (!read) return read;
    return withRows(
        database, "SELECT identifier FROM restore_data", known,
        [](ApplicationStatus& status, const Query&) { status.awaitsRestoreData = true; });
}

// What is void without a session.
Status gatherOfSession(Database& database, StatusByIdentifier& known) {
    Status read = withRows(database, "SELECT identifier FROM assertions", known,
                           [](ApplicationStatus& status, const Query&) { status.isHeld = true; });
    if (!read) return read;
    return withRows(
        database, "SELECT identifier, time, next_try FROM denials", known,
        [](ApplicationStatus& status, const Query& row) {
            status.denial = TerminationDenial{wallTime(row.integer(1)), wallTime(row.integer(2))};
        });
}

Status gatherEvents(Database& database, StatusByIdentifier& known) {
    Status read =
        withRows(database, "SELECT identifier, time, domain, code, description FROM failures",
                 known, [](ApplicationStatus& status, const Query& row) {
                     status.lastFailure = InstallFailure{
                         wallTime(row.integer(1)),
                         ErrorRecord::make(row.text(2), row.integer(3), row.text(4))};
                     if (status.coordinator) status.coordinator->error = status.lastFailure->error;
                 });
    if (!read) return read;
    return withRows(database, "SELECT identifier, time FROM uninstalled", known,
                    [](ApplicationStatus& status, const Query& row) {
                        status.uninstalled = wallTime(row.integer(1));
                    });
}

Status gatherMoment(Database& database, bool isUnderWay, DeviceMoment& moment) {
    std::optional<std::int64_t> process;
    std::optional<WallTime> since;
    Status read = findSession(database, process, since);
    moment.session = sessionOf(process, since, isUnderWay);
    StatusByIdentifier& known = moment.applications;
    if (read) read = gatherRecords(database, known);
    if (read) read = gatherCoordinators(database, known);
    if (read) read = gatherMarks(database, known);
    if (read && isUnderWay) read = gatherOfSession(database, known);
    if (read) read = gatherEvents(database, known);
    for (auto& [identifier, status] : known) status.sessionUnderWay = isUnderWay;
    return read;
}

HomeScreenItem itemOf(const ApplicationRecord& record, const RootDirectory& root) {
    HomeScreenItem item;
    item.identifier = record.identifier;
    item.name = record.name.value_or(record.identifier);
    item.icon = homeScreenIcon(record, root);
    item.isPlaceholder = record.isPlaceholder;
    if (record.progress) item.progress = record.progress->fraction();
    return item;
}

}  // namespace

Result<std::vector<ApplicationRecord>> listApplications(DeviceDatabase& database) {
    database.flush().ignore();
    std::vector<ApplicationRecord> records;
    const Status status = database.read([&](Database& connection) {
        Status read = appendRecords(connection, BundleTable::Applications, records);
        if (read) read = appendRecords(connection, BundleTable::Placeholders, records);
        if (read) read = addProgress(connection, records);
        return read ? addKept(connection, records) : read;
    });
    if (!status) return status.error();
    std::stable_sort(records.begin(), records.end(),
                     [](const ApplicationRecord& left, const ApplicationRecord& right) {
                         return left.identifier < right.identifier;
                     });
    return records;
}

Result<std::uint64_t> bytesKept(DeviceDatabase& database) {
    std::uint64_t bytes = 0;
    const Status status = database.read([&](Database& connection) -> Status {
        bytes = 0;
        const Result<std::vector<BundleRow>> rows = allKept(connection);
        if (!rows) return rows.error();
        for (const BundleRow& row : *rows) bytes += row.bytes;
        return {};
    });
    if (!status) return status.error();
    return bytes;
}

Result<std::vector<CoordinatorRecord>> listCoordinators(DeviceDatabase& database) {
    database.flush().ignore();
    std::vector<CoordinatorRecord> records;
    const Status status = database.read([&](Database& connection) -> Status {
        const auto coordinators = allCoordinators(connection);
        if (!coordinators) return coordinators.error();
        for (const StoredCoordinator& coordinator : *coordinators) {
            records.push_back(recordOf(coordinator));
            if (Status added = addLastFailure(connection, records.back()); !added) return added;
        }
        return {};
    });
    if (!status) return status.error();
    return records;
}

Result<std::vector<FailedInstall>> listFailedInstalls(DeviceDatabase& database) {
    database.flush().ignore();
    std::vector<FailedInstall> failed;
    const Status status = database.read([&](Database& connection) -> Status {
        Query rows = connection.query(
            "SELECT time, domain, code, description, identifier FROM failures"
            " ORDER BY time, identifier");
        while (rows.next()) failed.push_back({rows.text(4), failureOf(rows)});
        return rows.status();
    });
    if (!status) return status.error();
    return failed;
}

std::optional<InstallProgress> storedProgress(DeviceDatabase& database,
                                              const std::string& identifier) {
    std::optional<InstallProgress> progress;
    database
        .read([&](Database& connection) -> Status {
            const auto found = loadProgress(connection, identifier);
            if (!found) return found.error();
            progress = *found;
            return {};
        })
        .ignore();
    return progress;
}

Result<ApplicationStatus> applicationStatus(DeviceDatabase& database,
                                            const std::string& identifier) {
    database.flush().ignore();
    ApplicationStatus status;
    const Status read = database.read([&](Database& connection) {
        Status found = findRecords(connection, identifier, status);
        if (found) found = findMarks(connection, identifier, status);
        if (found) found = findEvents(connection, identifier, status);
        return found ? findCoordination(connection, identifier, status) : found;
    });
    if (!read) return read.error();
    return status;
}

Result<std::vector<std::string>> runningApplications(DeviceDatabase& database) {
    std::vector<std::string> identifiers;
    const Status status = database.read([&](Database& connection) {
        Query rows = connection.query("SELECT identifier FROM running ORDER BY identifier");
        while (rows.next()) identifiers.push_back(rows.text(0));
        return rows.status();
    });
    if (!status) return status.error();
    return identifiers;
}

Result<SessionRecord> sessionRecord(DeviceDatabase& database, bool isUnderWay) {
    std::optional<std::int64_t> process;
    std::optional<WallTime> since;
    const Status status = database.read(
        [&](Database& connection) { return findSession(connection, process, since); });
    if (!status) return status.error();
    return sessionOf(process, since, isUnderWay);
}

Result<DeviceMoment> deviceMoment(DeviceDatabase& database, bool isUnderWay) {
    database.flush().ignore();
    DeviceMoment moment;
    const Status status = database.read([&](Database& connection) {
        moment = {};
        return atOneMoment(connection,
                           [&] { return gatherMoment(connection, isUnderWay, moment); });
    });
    if (!status) return status.error();
    return moment;
}

std::vector<const ApplicationRecord*> homeScreenRecords(
    std::span<const std::string> order, std::span<const ApplicationRecord> records) {
    std::unordered_map<std::string_view, const ApplicationRecord*> byIdentifier;
    for (const ApplicationRecord& record : records) byIdentifier[record.identifier] = &record;
    std::vector<const ApplicationRecord*> shown;
    for (const std::string& identifier : order) {
        const auto found = byIdentifier.find(identifier);
        if (found != byIdentifier.end()) shown.push_back(found->second);
    }
    return shown;
}

Bytes homeScreenIcon(const ApplicationRecord& record, const RootDirectory& root) {
    const Result<RegularFile> file = root.openRegularFile(record.bundle + "/" + record.iconFile);
    if (!file) return {};
    Bytes bytes;
    if (readWhole(file->descriptor.get(), file->size, kMaximumIconFileBytes, bytes) != 0) return {};
    Result<Bytes> icon = renderIcon(bytes);
    return icon ? std::move(*icon) : Bytes();
}

std::vector<HomeScreenItem> homeScreenItems(std::span<const std::string> order,
                                            std::span<const ApplicationRecord> records,
                                            const RootDirectory& root) {
    std::vector<HomeScreenItem> items;
    for (const ApplicationRecord* record : homeScreenRecords(order, records)) {
        items.push_back(itemOf(*record, root));
    }
    return items;
}

}  // namespace appsync
