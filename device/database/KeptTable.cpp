#include "device/database/KeptTable.h"

#include "device/database/Database.h"
#include "device/database/DeviceSchema.h"

namespace appsync {

namespace {

BundleRow readKept(const Query& rows) {
    BundleRow row;
    row.identifier = rows.text(0);
    row.version = rows.optionalText(1);
    row.name = rows.optionalText(2);
    row.installType = rows.unsignedInteger(3);
    row.container = rows.text(4);
    row.bundle = rows.text(5);
    row.iconFile = rows.text(6);
    row.bytes = rows.unsignedInteger(7);
    return row;
}

Result<std::vector<BundleRow>> readAllKept(Query rows) {
    std::vector<BundleRow> all;
    while (rows.next()) all.push_back(readKept(rows));
    if (Status status = rows.status(); !status) return status.error();
    return all;
}

}  // namespace

Result<std::optional<BundleRow>> findKept(Database& database, const std::string& identifier) {
    const Result<bool> hasTable = hasKeptTable(database);
    if (!hasTable) return hasTable.error();
    if (!*hasTable) return std::optional<BundleRow>();
    Query rows = database.query(
        "SELECT identifier, version, name, install_type, container, bundle, icon, bytes FROM kept"
        " WHERE identifier = ?");
    rows.bind(identifier);
    Result<std::vector<BundleRow>> found = readAllKept(std::move(rows));
    if (!found) return found.error();
    return found->empty() ? std::nullopt : std::optional(std::move(found->front()));
}

Result<std::vector<BundleRow>> allKept(Database& database) {
    const Result<bool> hasTable = hasKeptTable(database);
    if (!hasTable) return hasTable.error();
    if (!*hasTable) return std::vector<BundleRow>();
    return readAllKept(
        database.query("SELECT identifier, version, name, install_type, container, bundle, icon,"
                       " bytes FROM kept ORDER BY id"));
}

Status keepReplaced(Database& database, const BundleRow& replaced, std::string& freed) {
    freed.clear();
    Query before = database.query("DELETE FROM kept WHERE identifier = ? RETURNING container");
    before.bind(replaced.identifier);
    while (before.next()) freed = before.text(0);
    if (Status status = before.status(); !status) return status;
    return database
        .query(
            "INSERT INTO kept (identifier, version, name, install_type, container, bundle, icon,"
            " bytes) VALUES (?, ?, ?, ?, ?, ?, ?, ?)")
        .bind(replaced.identifier, replaced.version, replaced.name, replaced.installType,
              replaced.container, replaced.bundle, replaced.iconFile, replaced.bytes)
        .run();
}

Status forgetKept(Database& database, const std::string& container) {
    return database.query("DELETE FROM kept WHERE container = ?").bind(container).run();
}

Status exchangeWithKept(Database& database, const BundleRow& application, const BundleRow& kept) {
    Status exchanged =
        database
            .query(
                "UPDATE applications SET version = ?, name = ?, install_type = ?, container = ?,"
                " bundle = ?, icon = ?, bytes = ? WHERE identifier = ?")
            .bind(kept.version, kept.name, kept.installType, kept.container, kept.bundle,
                  kept.iconFile, kept.bytes, application.identifier)
            .run();
    if (!exchanged) return exchanged;
    std::string inUseNow;
    return keepReplaced(database, application, inUseNow);
}

}  // namespace appsync
