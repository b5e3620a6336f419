#include "device/database/SumTable.h"

#include "device/database/Database.h"

namespace appsync {

Status recordSum(Database& database, const std::string& container, std::uint64_t sum) {
    return database.query("INSERT OR REPLACE INTO sums (container, sum) VALUES (?, ?)")
        .bind(container, sum)
        .run();
}

Result<std::optional<std::uint64_t>> findSum(Database& database, const std::string& container) {
    Query rows = database.query("SELECT sum FROM sums WHERE container = ?");
    rows.bind(container);
    std::optional<std::uint64_t> sum;
    if (rows.next()) sum = rows.unsignedInteger(0);
    if (Status status = rows.status(); !status) return status.error();
    return sum;
}

Status forgetOldSums(Database& database) {
    return database
        .query(
            "DELETE FROM sums WHERE container NOT IN"
            " (SELECT container FROM applications UNION ALL SELECT container FROM kept)")
        .run();
}

}  // namespace appsync
