#include "device/database/RegistryTables.h"

#include "device/database/Database.h"
#include "device/database/KeptTable.h"
#include "device/values/DevicePaths.h"

namespace appsync {

namespace {

const char* either(BundleTable table, const char* applications, const char* placeholders) {
    return table == BundleTable::Applications ? applications : placeholders;
}

BundleRow readRow(const Query& rows) {
    BundleRow row;
    row.identifier = rows.text(0);
    row.version = rows.optionalText(1);
    row.name = rows.optionalText(2);
    row.type = rows.text(3);
    row.installType = rows.unsignedInteger(4);
    row.container = rows.text(5);
    row.bundle = rows.text(6);
    row.iconFile = rows.text(7);
    row.bytes = rows.unsignedInteger(8);
    return row;
}

Result<std::vector<BundleRow>> readRows(Query rows) {
    std::vector<BundleRow> all;
    while (rows.next()) all.push_back(readRow(rows));
    if (Status status = rows.status(); !status) return status.error();
    return all;
}

// What the type of an application follows from when it is replaced, and its install type.
struct Predecessor {
    std::optional<BundleRow> application;
    std::optional<BundleRow> placeholder;
};

Status findPredecessor(Database& database, const std::string& identifier, Predecessor& result) {
    Result<std::optional<BundleRow>> application =
        findBundle(database, BundleTable::Applications, identifier);
    if (!application) return application.error();
    result.application = std::move(*application);
    Result<std::optional<BundleRow>> placeholder =
        findBundle(database, BundleTable::Placeholders, identifier);
    if (!placeholder) return placeholder.error();
    result.placeholder = std::move(*placeholder);
    return {};
}

std::string typeAfter(const Predecessor& predecessor, const BundleRow& row) {
    if (predecessor.application) return predecessor.application->type;
    if (predecessor.placeholder) return predecessor.placeholder->type;
    return row.type;
}

std::uint64_t installTypeAfter(const Predecessor& predecessor, const BundleRow& row) {
    if (!predecessor.placeholder) return row.installType;
    const std::uint64_t type = predecessor.placeholder->installType;
    const bool demoted = type == kInstallTypeDowngrade || type == kInstallTypeIntentionalDowngrade;
    return demoted ? row.installType : type;
}

// The same version again is no update: what an update has replaced before is kept on.
Status keepOrFree(Database& database, const Predecessor& predecessor, const BundleRow& row,
                  FreedContainers& freed) {
    if (!predecessor.application) return {};
    const BundleRow& replaced = *predecessor.application;
    if (replaced.version == row.version) {
        freed.application = replaced.container;
        return {};
    }
    freed.replaced = replaced.container;
    return keepReplaced(database, replaced, freed.kept);
}

// One more than the last arrival of all.
constexpr const char* kInsertApplication =
    "INSERT INTO applications (identifier, version, name, type, install_type, container, bundle,"
    " icon, bytes, arrived)"
    " VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, coalesce("
    "  (SELECT arrived FROM placeholders WHERE identifier = ?1),"
    "  1 + max((SELECT coalesce(max(arrived), 0) FROM applications),"
    "          (SELECT coalesce(max(arrived), 0) FROM placeholders))))"
    " ON CONFLICT (identifier) DO UPDATE SET version = excluded.version, name = excluded.name,"
    " type = excluded.type, install_type = excluded.install_type, container = excluded.container,"
    " bundle = excluded.bundle, icon = excluded.icon, bytes = excluded.bytes";

constexpr const char* kInsertPlaceholder =
    "INSERT INTO placeholders (identifier, version, name, type, install_type, container, bundle,"
    " icon, bytes, unsynced_boot, sinf, arrived)"
    " VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, ?10, ?11, coalesce("
    "  (SELECT arrived FROM applications WHERE identifier = ?1),"
    "  1 + max((SELECT coalesce(max(arrived), 0) FROM applications),"
    "          (SELECT coalesce(max(arrived), 0) FROM placeholders))))"
    " ON CONFLICT (identifier) DO UPDATE SET version = excluded.version, name = excluded.name,"
    " type = excluded.type, install_type = excluded.install_type, container = excluded.container,"
    " bundle = excluded.bundle, icon = excluded.icon, bytes = excluded.bytes,"
    " unsynced_boot = excluded.unsynced_boot, sinf = excluded.sinf";

Query& bindRow(Query& query, const BundleRow& row, const std::string& type,
               std::uint64_t installType) {
    return query.bind(row.identifier, row.version, row.name, type, installType, row.container,
                      row.bundle, row.iconFile, row.bytes);
}

// What waited for an install, or told of one, that is now done.
constexpr std::initializer_list<const char*> kInstallEnds = {
    "DELETE FROM placeholders WHERE identifier = ?", "DELETE FROM uninstalled WHERE identifier = ?",
    "DELETE FROM restore_data WHERE identifier = ?", "DELETE FROM failures WHERE identifier = ?",
    "DELETE FROM denials WHERE identifier = ?",
};

}  // namespace

AppProxy proxyOf(const BundleRow& row, BundleTable table) {
    AppProxy proxy;
    proxy.applicationIdentifier = row.identifier;
    proxy.bundleVersion = row.version;
    proxy.displayName = row.name;
    proxy.bundleContainerPath = containerPath(row.container);
    proxy.bundlePath = proxy.bundleContainerPath + "/" + row.bundle;
    proxy.applicationType = row.type;
    proxy.installType = row.installType;
    proxy.state.installed = table == BundleTable::Applications;
    proxy.state.placeholder = table == BundleTable::Placeholders;
    proxy.staticDiskUsage = row.bytes;
    return proxy;
}

ApplicationRecord recordOf(const BundleRow& row, BundleTable table) {
    ApplicationRecord record;
    record.identifier = row.identifier;
    record.version = row.version;
    record.name = row.name;
    record.isPlaceholder = table == BundleTable::Placeholders;
    record.type = row.type;
    record.installType = row.installType;
    record.container = containerPath(row.container);
    record.bundle = record.container + "/" + row.bundle;
    record.iconFile = row.iconFile;
    record.bytes = row.bytes;
    return record;
}

Result<std::optional<BundleRow>> findBundle(Database& database, BundleTable table,
                                            const std::string& identifier) {
    Query rows = database.query(
        either(table,
               "SELECT identifier, version, name, type, install_type, container, bundle, icon,"
               " bytes FROM applications WHERE identifier = ?",
               "SELECT identifier, version, name, type, install_type, container, bundle, icon,"
               " bytes FROM placeholders WHERE identifier = ?"));
    rows.bind(identifier);
    std::optional<BundleRow> row;
    if (rows.next()) row = readRow(rows);
    if (Status status = rows.status(); !status) return status.error();
    return row;
}

// One statement, so that the database is locked and looked through once.
Result<std::optional<FoundBundle>> findUppermost(Database& database,
                                                 const std::string& identifier) {
    Query rows = database.query(
        "SELECT identifier, version, name, type, install_type, container, bundle, icon, bytes, 1"
        " FROM placeholders WHERE identifier = ?1"
        " UNION ALL"
        " SELECT identifier, version, name, type, install_type, container, bundle, icon, bytes, 0"
        " FROM applications WHERE identifier = ?1");
    rows.bind(identifier);
    std::optional<FoundBundle> found;
    while (rows.next()) {
        const auto table =
            rows.integer(9) != 0 ? BundleTable::Placeholders : BundleTable::Applications;
        if (!found || table == BundleTable::Placeholders) found = {readRow(rows), table};
    }
    if (Status status = rows.status(); !status) return status.error();
    return found;
}

Result<bool> isInstalled(Database& database, const std::string& identifier) {
    Query rows = database.query("SELECT 1 FROM applications WHERE identifier = ?");
    rows.bind(identifier);
    const bool found = rows.next();
    if (Status status = rows.status(); !status) return status.error();
    return found;
}

Result<std::vector<BundleRow>> allBundles(Database& database, BundleTable table) {
    return readRows(database.query(
        either(table,
               "SELECT identifier, version, name, type, install_type, container, bundle, icon,"
               " bytes FROM applications ORDER BY identifier",
               "SELECT identifier, version, name, type, install_type, container, bundle, icon,"
               " bytes FROM placeholders ORDER BY identifier")));
}

Result<std::vector<BundleRow>> bundlesOfType(Database& database, BundleTable table,
                                             std::string_view type) {
    Query rows = database.query(
        either(table,
               "SELECT identifier, version, name, type, install_type, container, bundle, icon,"
               " bytes FROM applications WHERE type = ? ORDER BY identifier",
               "SELECT identifier, version, name, type, install_type, container, bundle, icon,"
               " bytes FROM placeholders WHERE type = ? ORDER BY identifier"));
    rows.bind(type);
    return readRows(std::move(rows));
}

Result<std::vector<BundleRow>> placeholdersWithProgress(Database& database) {
    return readRows(database.query(
        "SELECT identifier, version, name, type, install_type, container, bundle, icon, bytes"
        " FROM placeholders JOIN progress USING (identifier) ORDER BY arrived"));
}

Result<std::vector<std::string>> identifiersByArrival(Database& database) {
    Query rows = database.query(
        "SELECT identifier, min(arrived) AS first FROM"
        " (SELECT identifier, arrived FROM applications"
        "  UNION ALL SELECT identifier, arrived FROM placeholders)"
        " GROUP BY identifier ORDER BY first, identifier");
    std::vector<std::string> identifiers;
    while (rows.next()) identifiers.push_back(rows.text(0));
    if (Status status = rows.status(); !status) return status.error();
    return identifiers;
}

Status recordInstalled(Database& database, const BundleRow& row, FreedContainers& freed) {
    Predecessor predecessor;
    if (Status status = findPredecessor(database, row.identifier, predecessor); !status) {
        return status;
    }
    freed = {};
    if (predecessor.placeholder) freed.placeholder = predecessor.placeholder->container;
    if (Status status = keepOrFree(database, predecessor, row, freed); !status) return status;
    Query insert = database.query(kInsertApplication);
    const Status inserted =
        bindRow(insert, row, typeAfter(predecessor, row), installTypeAfter(predecessor, row)).run();
    if (!inserted) return inserted;
    for (const char* sql : kInstallEnds) {
        if (Status status = database.query(sql).bind(row.identifier).run(); !status) return status;
    }
    return {};
}

Status recordPlaceholder(Database& database, const BundleRow& row, const PlaceholderExtras& extras,
                         FreedContainers& freed) {
    Predecessor predecessor;
    if (Status status = findPredecessor(database, row.identifier, predecessor); !status) {
        return status;
    }
    freed = {};
    if (predecessor.placeholder) freed.placeholder = predecessor.placeholder->container;
    Query insert = database.query(kInsertPlaceholder);
    return bindRow(insert, row, typeAfter(predecessor, row), row.installType)
        .bind(extras.unsyncedBoot, extras.sinf)
        .run();
}

Status forgetApplication(Database& database, const std::string& identifier,
                         FreedContainers& freed) {
    const Result<std::optional<BundleRow>> kept = findKept(database, identifier);
    if (!kept) return kept.error();
    freed.kept = *kept ? (*kept)->container : "";
    freed.application.clear();
    Query rows =
        database.query("DELETE FROM applications WHERE identifier = ? RETURNING container");
    rows.bind(identifier);
    while (rows.next()) freed.application = rows.text(0);
    return rows.status();
}

Status forgetPlaceholder(Database& database, const std::string& identifier,
                         std::string& container) {
    container.clear();
    Query rows =
        database.query("DELETE FROM placeholders WHERE identifier = ? RETURNING container");
    rows.bind(identifier);
    while (rows.next()) container = rows.text(0);
    return rows.status();
}

}  // namespace appsync
