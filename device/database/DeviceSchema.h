#pragma once

#include <cstdint>

#include "platform/Result.h"

namespace appsync {

class Database;

/// Marks a file as a device's database ("Apps" in SQLite's application_id).
inline constexpr int kDeviceApplicationId = 0x41707073;

/// The schema that this version makes; docs/device-format.md describes it. One of an earlier
/// version serves whoever looks; a session brings it up to date first, where there is room for
/// that.
inline constexpr int kDeviceSchemaVersion = 5;

/// Makes the tables of an empty database, and marks it as a device's.
Status createDeviceSchema(Database& database);

/// Refuses a database that is no device's, that is not whole, that a newer version made, or that
/// holds other tables, indexes, views or triggers than a device's: those of somebody else would
/// take part in every statement.
Status checkDeviceSchema(Database& database);

/// The free space that bringing it up to date takes, with what a session needs besides; 0 where it
/// is of this version.
[[nodiscard]] Result<std::uint64_t> roomToBringSchemaUpToDate(Database& database);

/// Whether it has the table `kept`, which came with version 3.
[[nodiscard]] Result<bool> hasKeptTable(Database& database);

/// Makes a database of an earlier version one of this version, in the caller's transaction; nothing
/// that it holds is lost. No work where it is one already.
Status bringSchemaUpToDate(Database& database);

/// The same as far as a session needs it, which takes little room, however much the database holds.
Status makeSchemaUsable(Database& database);

/// Reads the whole database and refuses it when it is damaged.
Status checkDeviceDatabase(Database& database);

}  // namespace appsync
