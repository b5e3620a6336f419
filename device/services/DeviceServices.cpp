#include "device/services/DeviceServices.h"

#include <algorithm>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/values/WallClock.h"
#include "platform/AppRegistry.h"

namespace appsync {

namespace {

constexpr const char* kInstallation = "installation";
constexpr const char* kRemoval = "removal";
constexpr const char* kCoordination = "coordination";

PropertyList dateOf(std::int64_t milliseconds) {
    constexpr double secondsFrom1970To2001 = 978'307'200;
    const double seconds = static_cast<double>(milliseconds) / 1000;
    return PropertyList::Date{seconds - secondsFrom1970To2001};
}

PropertyList uninstalledEntry(const Query& row) {
    PropertyList entry = PropertyList::map({{"UninstallDate", dateOf(row.integer(2))}});
    if (const auto version = row.optionalText(1)) entry.set(BundleVersionKey, *version);
    return entry;
}

PolicyAnswer answerOf(std::int64_t value) {
    if (value == static_cast<std::int64_t>(PolicyAnswer::Yes)) return PolicyAnswer::Yes;
    if (value == static_cast<std::int64_t>(PolicyAnswer::No)) return PolicyAnswer::No;
    return PolicyAnswer::Unset;
}

Status setSetting(Database& database, const char* name, std::int64_t value) {
    return database.query("INSERT OR REPLACE INTO settings (name, value) VALUES (?, ?)")
        .bind(name, value)
        .run();
}

Status setAnswer(Database& database, const char* name, const std::optional<PolicyAnswer>& answer) {
    if (!answer) return {};
    return setSetting(database, name, static_cast<std::int64_t>(*answer));
}

class Manager final : public BackupManager {
  public:
    Manager(DeviceDatabase& database, DeviceBackup& backup)
        : database_(database), backup_(backup) {}

    bool restoreDataExists(const std::string& identifier) override {
        bool exists = false;
        database_
            .read([&](Database& database) {
                Query rows = database.query("SELECT 1 FROM restore_data WHERE identifier = ?");
                rows.bind(identifier);
                exists = rows.next();
                return rows.status();
            })
            .ignore();
        return exists;
    }

    void cancelApplicationRestore(const std::string& identifier) override {
        backup_.setRestoreDataExpected(identifier, false).ignore();
    }

  private:
    DeviceDatabase& database_;
    DeviceBackup& backup_;
};

HistoryRecord historyRecord(const Query& row) {
    HistoryRecord record;
    record.time = wallTime(row.integer(0));
    record.kind = static_cast<HistoryRecord::Kind>(row.integer(1));
    record.scenario = row.text(2);
    record.step = row.unsignedInteger(3);
    record.party = row.unsignedInteger(4);
    record.phase = row.unsignedInteger(5);
    record.success = row.integer(6) != 0;
    record.identifier = row.text(7);
    record.description = row.text(8);
    return record;
}

}  // namespace

std::optional<PropertyList> DeviceInstaller::lookupUninstalled() {
    PropertyList list = PropertyList::map();
    const Status status = database_.read([&](Database& database) {
        Query rows =
            database.query("SELECT identifier, version, time FROM uninstalled ORDER BY rowid");
        while (rows.next()) list.set(rows.text(0), uninstalledEntry(rows));
        return rows.status();
    });
    if (!status) return std::nullopt;
    return list;
}

bool DeviceInstaller::clearUninstalled(std::span<const std::string> identifiers) {
    const Status status = database_.change(Durability::OnDisk, [&](Database& database) -> Status {
        for (const std::string& identifier : identifiers) {
            Query removal = database.query("DELETE FROM uninstalled WHERE identifier = ?");
            if (Status removed = removal.bind(identifier).run(); !removed) return removed;
        }
        return {};
    });
    return status.ok();
}

PolicyAnswer DevicePolicy::effectiveValue(PolicyFeature feature) {
    const Result<DeviceSettings> now = settings();
    if (!now) return PolicyAnswer::Unset;
    return feature == PolicyFeature::AppInstallationAllowed ? now->installation : now->removal;
}

Result<DeviceSettings> DevicePolicy::settings() {
    DeviceSettings settings;
    const Status status = database_.read([&](Database& database) {
        Query rows = database.query("SELECT name, value FROM settings");
        while (rows.next()) {
            const std::string name = rows.text(0);
            if (name == kInstallation) settings.installation = answerOf(rows.integer(1));
            if (name == kRemoval) settings.removal = answerOf(rows.integer(1));
            if (name == kCoordination) settings.coordination = rows.integer(1) != 0;
        }
        return rows.status();
    });
    if (!status) return status.error();
    return settings;
}

Status DevicePolicy::change(const DeviceSettingsChange& change) {
    return database_.change(Durability::OnDisk, [&](Database& database) -> Status {
        Status status = setAnswer(database, kInstallation, change.installation);
        if (status) status = setAnswer(database, kRemoval, change.removal);
        if (!status || !change.coordination) return status;
        return setSetting(database, kCoordination, *change.coordination ? 1 : 0);
    });
}

std::unique_ptr<BackupManager> DeviceBackup::makeManager() {
    return std::make_unique<Manager>(database_, *this);
}

Status DeviceBackup::setRestoreDataExpected(const std::string& identifier, bool expected) {
    return database_.change(Durability::OnDisk, [&](Database& database) {
        const char* sql = expected ? "INSERT OR IGNORE INTO restore_data (identifier) VALUES (?)"
                                   : "DELETE FROM restore_data WHERE identifier = ?";
        return database.query(sql).bind(identifier).run();
    });
}

Status DeviceBackup::expectRestoreData(const std::vector<std::string>& identifiers) {
    return database_.change(Durability::OnDisk, [&](Database& database) -> Status {
        for (const std::string& identifier : identifiers) {
            Query insert =
                database.query("INSERT OR IGNORE INTO restore_data (identifier) VALUES (?)");
            if (Status status = insert.bind(identifier).run(); !status) return status;
        }
        return {};
    });
}

void DeviceHistory::initialize(const LogHandle& /*handle*/) {}

void DeviceHistory::logStep(std::uint64_t kind, std::uint64_t party, std::uint64_t phase,
                            bool success, std::string_view identifier,
                            std::string_view description) {
    append({wallNow(),
            HistoryRecord::Kind::Step,
            {},
            kind,
            party,
            phase,
            success,
            std::string(identifier),
            std::string(description)});
}

void DeviceHistory::logScenario(std::string_view scenario, std::uint64_t step, bool success,
                                std::string_view identifier, std::string_view description) {
    append({wallNow(), HistoryRecord::Kind::Scenario, std::string(scenario), step, 0, 0, success,
            std::string(identifier), std::string(description)});
}

void DeviceHistory::append(HistoryRecord record) {
    database_.changeLater([record = std::move(record)](Database& database) {
        return database
            .query(
                "INSERT INTO history (time, kind, scenario, step, party, phase, success,"
                " identifier, description) VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?)")
            .bind(milliseconds(record.time), static_cast<std::int64_t>(record.kind),
                  record.scenario, record.step, record.party, record.phase, record.success,
                  record.identifier, record.description)
            .run();
    });
}

Result<std::vector<HistoryRecord>> DeviceHistory::records(std::size_t limit) {
    database_.flush().ignore();
    std::vector<HistoryRecord> records;
    const Status status = database_.read([&](Database& database) {
        Query rows = database.query(
            "SELECT time, kind, scenario, step, party, phase, success,"
            " identifier, description FROM history"
            " ORDER BY id DESC LIMIT ?");
        rows.bind(std::uint64_t{limit});
        while (rows.next()) records.push_back(historyRecord(rows));
        return rows.status();
    });
    if (!status) return status.error();
    std::reverse(records.begin(), records.end());
    return records;
}

}  // namespace appsync
