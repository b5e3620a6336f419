#include "device/DeviceSchema.h"

#include <string>
#include <string_view>
#include <vector>

#include "device/Database.h"
#include "device/DeviceError.h"

namespace appsync {

namespace {

constexpr const char* kTables = R"sql(
CREATE TABLE applications (
    identifier TEXT PRIMARY KEY,
    version TEXT,
    name TEXT,
    type TEXT NOT NULL,
    install_type INTEGER NOT NULL,
    container TEXT NOT NULL UNIQUE,
    bundle TEXT NOT NULL,
    icon TEXT NOT NULL,
    bytes INTEGER NOT NULL,
    arrived INTEGER NOT NULL
) STRICT;
CREATE INDEX applications_by_arrival ON applications (arrived);

CREATE TABLE placeholders (
    identifier TEXT PRIMARY KEY,
    version TEXT,
    name TEXT,
    type TEXT NOT NULL,
    install_type INTEGER NOT NULL,
    container TEXT NOT NULL UNIQUE,
    bundle TEXT NOT NULL,
    icon TEXT NOT NULL,
    bytes INTEGER NOT NULL,
    arrived INTEGER NOT NULL,
    unsynced_boot TEXT,
    sinf BLOB
) STRICT;
CREATE INDEX placeholders_by_arrival ON placeholders (arrived);
CREATE INDEX placeholders_unsynced ON placeholders (unsynced_boot)
    WHERE unsynced_boot IS NOT NULL;

CREATE TABLE progress (
    identifier TEXT PRIMARY KEY REFERENCES placeholders (identifier) ON DELETE CASCADE,
    state INTEGER NOT NULL,
    phase INTEGER NOT NULL,
    total INTEGER NOT NULL,
    completed INTEGER NOT NULL,
    unpacked INTEGER NOT NULL DEFAULT 0
) STRICT;

CREATE TABLE uninstalled (
    identifier TEXT PRIMARY KEY,
    version TEXT,
    time INTEGER NOT NULL
) STRICT;

CREATE TABLE coordinators (
    id INTEGER PRIMARY KEY AUTOINCREMENT,
    identifier TEXT NOT NULL UNIQUE,
    kind INTEGER NOT NULL,
    client INTEGER NOT NULL,
    created INTEGER NOT NULL,
    responsible INTEGER,
    options BLOB,
    initial_assets INTEGER NOT NULL DEFAULT 0,
    placeholder INTEGER NOT NULL DEFAULT 0
) STRICT;

CREATE TABLE promises (
    coordinator INTEGER NOT NULL REFERENCES coordinators (id) ON DELETE CASCADE,
    role INTEGER NOT NULL,
    position INTEGER NOT NULL,
    name TEXT NOT NULL,
    client INTEGER NOT NULL,
    path TEXT,
    space INTEGER NOT NULL,
    percent INTEGER NOT NULL,
    complete INTEGER NOT NULL,
    cancelled INTEGER NOT NULL,
    PRIMARY KEY (coordinator, role, position)
) STRICT, WITHOUT ROWID;

CREATE TABLE cancellations (
    id INTEGER PRIMARY KEY AUTOINCREMENT,
    coordinator INTEGER NOT NULL,
    identifier TEXT NOT NULL,
    client INTEGER NOT NULL,
    domain TEXT NOT NULL,
    code INTEGER NOT NULL,
    description TEXT NOT NULL
) STRICT;

CREATE TABLE settings (
    name TEXT PRIMARY KEY,
    value INTEGER NOT NULL
) STRICT;

CREATE TABLE icon_layout (
    id INTEGER PRIMARY KEY CHECK (id = 1),
    state BLOB NOT NULL
) STRICT;

CREATE TABLE running (
    identifier TEXT PRIMARY KEY REFERENCES applications (identifier) ON DELETE CASCADE
) STRICT;

CREATE TABLE assertions (
    identifier TEXT PRIMARY KEY,
    count INTEGER NOT NULL
) STRICT;

CREATE TABLE denials (
    identifier TEXT PRIMARY KEY,
    time INTEGER NOT NULL,
    next_try INTEGER NOT NULL
) STRICT;

CREATE TABLE failures (
    identifier TEXT PRIMARY KEY,
    time INTEGER NOT NULL,
    domain TEXT NOT NULL,
    code INTEGER NOT NULL,
    description TEXT NOT NULL
) STRICT;

CREATE TABLE restore_data (
    identifier TEXT PRIMARY KEY
) STRICT;

CREATE TABLE history (
    id INTEGER PRIMARY KEY AUTOINCREMENT,
    time INTEGER NOT NULL,
    kind INTEGER NOT NULL,
    scenario TEXT NOT NULL,
    step INTEGER NOT NULL,
    party INTEGER NOT NULL,
    phase INTEGER NOT NULL,
    success INTEGER NOT NULL,
    identifier TEXT NOT NULL,
    description TEXT NOT NULL
) STRICT;

CREATE TABLE session (
    id INTEGER PRIMARY KEY CHECK (id = 1),
    process INTEGER NOT NULL,
    started INTEGER NOT NULL
) STRICT;
)sql";

ErrorRecord halfCreated(const Database& database) {
    return deviceError(DeviceErrorCode::HalfCreated,
                       "the creation of this device did not finish: " + database.path() +
                           " holds nothing; remove the directory and create the device again");
}

ErrorRecord notADevice(const Database& database) {
    return deviceError(DeviceErrorCode::NotADevice,
                       database.path() +
                           " is a database, but not that of a device; give the "
                           "directory of a device");
}

ErrorRecord newerSchema(const Database& database, std::int64_t version) {
    return deviceError(DeviceErrorCode::NewerSchema,
                       "the device's database " + database.path() + " is of version " +
                           std::to_string(version) + ", and this program knows versions up to " +
                           std::to_string(kDeviceSchemaVersion) +
                           "; use the newer version of the program that made it");
}

ErrorRecord damaged(const Database& database, const std::string& what) {
    return deviceError(DeviceErrorCode::Damaged,
                       "the device's database " + database.path() + " is damaged (" + what +
                           "); put a copy of the device in its place, or create a new device and "
                           "sync it");
}

// The names that kTables creates.
std::vector<std::string> tableNames() {
    constexpr std::string_view kCreates = "CREATE TABLE ";
    const std::string_view script = kTables;
    std::vector<std::string> names;
    for (std::size_t at = script.find(kCreates); at != script.npos;
         at = script.find(kCreates, at)) {
        at += kCreates.size();
        names.emplace_back(script.substr(at, script.find(' ', at) - at));
    }
    return names;
}

Status checkTables(Database& database) {
    for (const std::string& name : tableNames()) {
        Query rows =
            database.query("SELECT 1 FROM sqlite_schema WHERE type = 'table' AND name = ?");
        rows.bind(name);
        const bool found = rows.next();
        if (Status status = rows.status(); !status) return status;
        if (!found) return damaged(database, "it has no table " + name);
    }
    return {};
}

}  // namespace

Status createDeviceSchema(Database& database) {
    if (Status status = database.execute("PRAGMA journal_mode = WAL; PRAGMA synchronous = FULL;");
        !status) {
        return status;
    }
    const std::string marks = "PRAGMA application_id = " + std::to_string(kDeviceApplicationId) +
                              "; PRAGMA user_version = " + std::to_string(kDeviceSchemaVersion);
    const std::string script = std::string("BEGIN;") + kTables + marks + "; COMMIT;";
    return database.execute(script.c_str());
}

Status checkDeviceSchema(Database& database) {
    const Result<std::int64_t> tables = database.integer("SELECT count(*) FROM sqlite_schema");
    if (!tables) return tables.error();
    if (*tables == 0) return halfCreated(database);
    const Result<std::int64_t> application = database.integer("PRAGMA application_id");
    if (!application) return application.error();
    if (*application != kDeviceApplicationId) return notADevice(database);
    const Result<std::int64_t> version = database.integer("PRAGMA user_version");
    if (!version) return version.error();
    if (*version > kDeviceSchemaVersion) return newerSchema(database, *version);
    if (*version < 1) return damaged(database, "it has no schema version");
    return {};
}

Status checkDeviceDatabase(Database& database) {
    if (Status status = checkTables(database); !status) return status;
    Query lines = database.query("PRAGMA quick_check(1)");
    const std::string answer = lines.next() ? lines.text(0) : "no answer";
    if (!lines.status()) return lines.status();
    if (answer != "ok") return damaged(database, answer);
    return {};
}

}  // namespace appsync
