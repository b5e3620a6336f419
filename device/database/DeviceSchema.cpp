#include "device/database/DeviceSchema.h"

#include <algorithm>
#include <set>
#include <string>
#include <string_view>

#include "device/database/Database.h"
#include "device/values/DeviceError.h"
#include "device/values/PackageText.h"

namespace appsync {

namespace {

// Those that are in every version, the same.
constexpr const char* kTables = R"sql(
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
)sql";

// An `id` of `uninstalled` is never given again, so it tells what came before a session and what
// during it, whatever the clock does.
constexpr const char* kTablesSinceVersion2 = R"sql(
CREATE TABLE uninstalled (
    id INTEGER PRIMARY KEY AUTOINCREMENT,
    identifier TEXT NOT NULL UNIQUE,
    version TEXT,
    time INTEGER NOT NULL
) STRICT;

CREATE TABLE session (
    id INTEGER PRIMARY KEY CHECK (id = 1),
    process INTEGER NOT NULL,
    started INTEGER NOT NULL,
    last_uninstall INTEGER NOT NULL
) STRICT;
)sql";

// An `id` is greater than that of whatever was kept before.
constexpr const char* kTablesSinceVersion3 = R"sql(
CREATE TABLE kept (
    id INTEGER PRIMARY KEY,
    identifier TEXT NOT NULL UNIQUE REFERENCES applications (identifier) ON DELETE CASCADE,
    version TEXT,
    name TEXT,
    install_type INTEGER NOT NULL,
    container TEXT NOT NULL UNIQUE,
    bundle TEXT NOT NULL,
    icon TEXT NOT NULL,
    bytes INTEGER NOT NULL
) STRICT;
)sql";

constexpr const char* kTablesSinceVersion4 = R"sql(
CREATE TABLE sums (
    container TEXT PRIMARY KEY,
    sum INTEGER NOT NULL
) STRICT, WITHOUT ROWID;
)sql";

constexpr const char* kTableOfRunning = R"sql(
CREATE TABLE running (
    identifier TEXT PRIMARY KEY REFERENCES applications (identifier) ON DELETE CASCADE
) STRICT;
)sql";

constexpr const char* kTablesUntilVersion4 = R"sql(
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
)sql";

// Each row stands in as few pages as it can, as every page that a transaction touches is written:
// a place in the order of arrival is nobody else's, and so it is the key.
constexpr const char* kTablesSinceVersion5 = R"sql(
CREATE TABLE applications (
    identifier TEXT NOT NULL UNIQUE,
    version TEXT,
    name TEXT,
    type TEXT NOT NULL,
    install_type INTEGER NOT NULL,
    container TEXT NOT NULL,
    bundle TEXT NOT NULL,
    icon TEXT NOT NULL,
    bytes INTEGER NOT NULL,
    arrived INTEGER PRIMARY KEY
) STRICT;

CREATE TABLE placeholders (
    identifier TEXT NOT NULL UNIQUE,
    version TEXT,
    name TEXT,
    type TEXT NOT NULL,
    install_type INTEGER NOT NULL,
    container TEXT NOT NULL,
    bundle TEXT NOT NULL,
    icon TEXT NOT NULL,
    bytes INTEGER NOT NULL,
    arrived INTEGER PRIMARY KEY,
    unsynced_boot TEXT,
    sinf BLOB
) STRICT;

CREATE TABLE progress (
    identifier TEXT PRIMARY KEY REFERENCES placeholders (identifier) ON DELETE CASCADE,
    state INTEGER NOT NULL,
    phase INTEGER NOT NULL,
    total INTEGER NOT NULL,
    completed INTEGER NOT NULL,
    unpacked INTEGER NOT NULL DEFAULT 0
) STRICT, WITHOUT ROWID;

CREATE TABLE history (
    id INTEGER PRIMARY KEY,
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
)sql";

constexpr const char* kTablesOfVersion1 = R"sql(
CREATE TABLE uninstalled (
    identifier TEXT PRIMARY KEY,
    version TEXT,
    time INTEGER NOT NULL
) STRICT;

CREATE TABLE session (
    id INTEGER PRIMARY KEY CHECK (id = 1),
    process INTEGER NOT NULL,
    started INTEGER NOT NULL
) STRICT;
)sql";

constexpr const char* kSetVersion1Aside =
    "ALTER TABLE uninstalled RENAME TO former_uninstalled;"
    "ALTER TABLE session RENAME TO former_session;";

constexpr const char* kTakeOverVersion1 =
    "INSERT INTO uninstalled (identifier, version, time)"
    " SELECT identifier, version, time FROM former_uninstalled ORDER BY time, identifier;"
    "INSERT INTO session (id, process, started, last_uninstall)"
    " SELECT id, process, started, 0 FROM former_session;"
    "DROP TABLE former_uninstalled;"
    "DROP TABLE former_session;";

// With the tables that refer to them, whose references a renaming changes.
constexpr const char* kSetVersion4Aside =
    "ALTER TABLE applications RENAME TO former_applications;"
    "ALTER TABLE placeholders RENAME TO former_placeholders;"
    "ALTER TABLE progress RENAME TO former_progress;"
    "ALTER TABLE running RENAME TO former_running;"
    "ALTER TABLE kept RENAME TO former_kept;"
    "ALTER TABLE history RENAME TO former_history;";

constexpr const char* kTakeOverVersion4 = R"sql(
CREATE TABLE arrivals (place INTEGER PRIMARY KEY, identifier TEXT UNIQUE);
INSERT INTO arrivals (identifier)
    SELECT identifier FROM (SELECT identifier, arrived FROM former_applications
                            UNION ALL SELECT identifier, arrived FROM former_placeholders)
    GROUP BY identifier ORDER BY min(arrived), identifier;
INSERT INTO applications
    SELECT identifier, version, name, type, install_type, container, bundle, icon, bytes, place
    FROM former_applications JOIN arrivals USING (identifier);
INSERT INTO placeholders
    SELECT identifier, version, name, type, install_type, container, bundle, icon, bytes, place,
           unsynced_boot, sinf
    FROM former_placeholders JOIN arrivals USING (identifier);
INSERT INTO progress SELECT * FROM former_progress
    WHERE identifier IN (SELECT identifier FROM placeholders);
INSERT INTO running SELECT * FROM former_running
    WHERE identifier IN (SELECT identifier FROM applications);
INSERT INTO kept SELECT * FROM former_kept
    WHERE identifier IN (SELECT identifier FROM applications);
INSERT INTO history SELECT * FROM former_history;
DROP TABLE arrivals;
DROP TABLE former_progress;
DROP TABLE former_running;
DROP TABLE former_kept;
DROP TABLE former_placeholders;
DROP TABLE former_applications;
DROP TABLE former_history;
)sql";

std::string tablesOf(std::int64_t version) {
    return std::string(kTables) + kTableOfRunning +
           (version == 1 ? kTablesOfVersion1 : kTablesSinceVersion2) +
           (version < 3 ? "" : kTablesSinceVersion3) + (version < 4 ? "" : kTablesSinceVersion4) +
           (version < 5 ? kTablesUntilVersion4 : kTablesSinceVersion5);
}

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

// The statements of the tables, as the database keeps them.
std::set<std::string> expectedStatements(std::int64_t version) {
    const std::string tables = tablesOf(version);
    std::string_view script = tables;
    std::set<std::string> statements;
    for (std::size_t end = script.find(';'); end != script.npos; end = script.find(';')) {
        const std::size_t begin = script.find_first_not_of(" \n");
        statements.emplace(script.substr(begin, end - begin));
        script.remove_prefix(end + 1);
    }
    return statements;
}

// "CREATE TABLE name ..." -> "table name".
std::string creationOf(const std::string& statement) {
    constexpr std::size_t kCreate = std::string_view("CREATE ").size();
    const std::size_t name = statement.find(' ', kCreate) + 1;
    std::string kind = statement.substr(kCreate, name - kCreate);
    std::transform(kind.begin(), kind.end(), kind.begin(),
                   [](char letter) { return static_cast<char>(letter | 0x20); });
    return kind + statement.substr(name, statement.find_first_of(" (", name) - name);
}

// Exactly what createDeviceSchema makes, or made: a trigger, a view or an index that somebody has
// put there would do its work with ours.
Status checkDefinitions(Database& database, std::int64_t version) {
    std::set<std::string> missing = expectedStatements(version);
    Query rows = database.query(
        "SELECT type, name, sql FROM sqlite_schema WHERE substr(name, 1, 7) <> 'sqlite_'");
    while (rows.next()) {
        if (missing.erase(rows.text(2)) == 1) continue;
        return damaged(database, "its " + rows.text(0) + " " + quotedName(rows.text(1)) +
                                     " is not that of a device");
    }
    if (Status status = rows.status(); !status) return status;
    if (missing.empty()) return {};
    return damaged(database, "it has no " + creationOf(*missing.begin()));
}

Status leaveVersion1(Database& database) {
    Status status = database.execute(kSetVersion1Aside);
    if (status) status = database.execute(kTablesSinceVersion2);
    return status ? database.execute(kTakeOverVersion1) : status;
}

Status leaveVersion4(Database& database) {
    Status status = database.execute(kSetVersion4Aside);
    for (const char* tables : {kTablesSinceVersion5, kTableOfRunning, kTablesSinceVersion3}) {
        if (status) status = database.execute(tables);
    }
    return status ? database.execute(kTakeOverVersion4) : status;
}

// The tables of the versions from this one on have the same columns.
constexpr std::int64_t kUsableVersion = 4;

Status bringSchemaTo(Database& database, std::int64_t wanted) {
    const Result<std::int64_t> version = database.integer("PRAGMA user_version");
    if (!version) return version.error();
    if (*version >= wanted) return {};
    Status status;
    if (*version < 2) status = leaveVersion1(database);
    if (status && *version < 3) status = database.execute(kTablesSinceVersion3);
    if (status && *version < 4) status = database.execute(kTablesSinceVersion4);
    if (status && wanted >= 5) status = leaveVersion4(database);
    if (!status) return status;
    return database.execute(("PRAGMA user_version = " + std::to_string(wanted)).c_str());
}

}  // namespace

Status createDeviceSchema(Database& database) {
    if (Status status = database.execute("PRAGMA journal_mode = WAL; PRAGMA synchronous = FULL;");
        !status) {
        return status;
    }
    const std::string marks = "PRAGMA application_id = " + std::to_string(kDeviceApplicationId) +
                              "; PRAGMA user_version = " + std::to_string(kDeviceSchemaVersion);
    const std::string script = "BEGIN;" + tablesOf(kDeviceSchemaVersion) + marks + "; COMMIT;";
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
    return checkDefinitions(database, *version);
}

// Its rows stand there twice until it is done, in the log and, once that is taken over, in the
// file: three times its size were measured, and a session needs some room for itself.
Result<std::uint64_t> roomToBringSchemaUpToDate(Database& database) {
    constexpr std::uint64_t kForTheSession = std::uint64_t{512} << 10U;
    std::uint64_t room = 3;
    const Result<std::int64_t> version = database.integer("PRAGMA user_version");
    if (!version) return version.error();
    if (*version >= kDeviceSchemaVersion) return std::uint64_t{0};
    for (const char* factor : {"PRAGMA page_count", "PRAGMA page_size"}) {
        const Result<std::int64_t> value = database.integer(factor);
        if (!value) return value.error();
        room *= static_cast<std::uint64_t>(*value);
    }
    return room + kForTheSession;
}

Result<bool> hasKeptTable(Database& database) {
    const Result<std::int64_t> version = database.integer("PRAGMA user_version");
    if (!version) return version.error();
    return *version >= 3;
}

Status bringSchemaUpToDate(Database& database) {
    return bringSchemaTo(database, kDeviceSchemaVersion);
}

Status makeSchemaUsable(Database& database) { return bringSchemaTo(database, kUsableVersion); }

Status checkDeviceDatabase(Database& database) {
    Query lines = database.query("PRAGMA quick_check(1)");
    const std::string answer = lines.next() ? lines.text(0) : "no answer";
    if (!lines.status()) return lines.status();
    if (answer != "ok") return damaged(database, answer);
    return {};
}

}  // namespace appsync
