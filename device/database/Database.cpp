#include "device/database/Database.h"

#include <sqlite3.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <utility>

#include "device/database/JoinedLog.h"
#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "system/file/PosixError.h"

namespace appsync {

namespace {

constexpr int kBusyTimeoutMilliseconds = 10'000;

// What is known of a failure of SQLite.
struct Failure {
    int resultCode = 0;
    int systemError = 0;  // errno, where the system was the cause
    std::string reason;
    const std::string& path;
};

bool meansNoSpace(int systemError) { return systemError == ENOSPC || systemError == EDQUOT; }

// Without its shared memory file a database cannot even be read, and what failed there may hide the
// system's reason.
bool hasNoSpace(const Failure& failure) {
    switch (failure.resultCode & 0xff) {
        case SQLITE_FULL:
            return true;
        case SQLITE_IOERR:
        case SQLITE_CANTOPEN: {
            if (meansNoSpace(failure.systemError)) return true;
            struct statvfs space = {};
            return ::statvfs(failure.path.c_str(), &space) == 0 && space.f_blocks > 0 &&
                   space.f_bavail == 0;
        }
        default:
            return false;
    }
}

// Where the space that a device keeps back is still there, an application can be removed.
const char* adviceForFullDisk(const std::string& database) {
    const std::filesystem::path reserve =
        std::filesystem::path(database).parent_path() / kReserveName;
    return ::access(reserve.c_str(), F_OK) == 0
               ? "free some space there and try again, or remove an application with appsync "
                 "uninstall"
               : "free some space there and try again";
}

// The files that a database needs beside it are made where it stands.
bool isWriteProtected(const Failure& failure) {
    const int primary = failure.resultCode & 0xff;
    if (primary == SQLITE_READONLY || primary == SQLITE_PERM) return true;
    if (primary != SQLITE_CANTOPEN) return false;
    const std::string directory = std::filesystem::path(failure.path).parent_path().string();
    return ::access(failure.path.c_str(), W_OK) != 0 || ::access(directory.c_str(), W_OK) != 0;
}

// The system's reason for the last failure on the log or the database. What SQLite tells itself
// may be of a call that it has made since.
int systemErrorOf(sqlite3* handle) {
    sqlite3_file* log = nullptr;
    int ofLog = 0;
    if (sqlite3_file_control(handle, "main", SQLITE_FCNTL_JOURNAL_POINTER, &log) == SQLITE_OK &&
        log != nullptr && log->pMethods != nullptr) {
        log->pMethods->xFileControl(log, SQLITE_FCNTL_LAST_ERRNO, &ofLog);
    }
    if (meansNoSpace(ofLog)) return ofLog;
    int ofDatabase = 0;
    sqlite3_file_control(handle, "main", SQLITE_FCNTL_LAST_ERRNO, &ofDatabase);
    return meansNoSpace(ofDatabase) ? ofDatabase : sqlite3_system_errno(handle);
}

// What the system says of it, where it was the cause.
std::string systemReason(const Failure& failure) {
    const int primary = failure.resultCode & 0xff;
    const bool isOfSystem = primary == SQLITE_IOERR || primary == SQLITE_CANTOPEN;
    if (!isOfSystem || failure.systemError == 0) return {};
    return ": " + posixReason(failure.systemError);
}

// The one place where SQLite's result codes become errors.
ErrorRecord databaseError(const Failure& failure) {
    const std::string what = "the device's database " + failure.path;
    if (hasNoSpace(failure)) {
        return deviceError(DeviceErrorCode::NoSpace,
                           what + " cannot grow: the disk that it is on is full; " +
                               adviceForFullDisk(failure.path));
    }
    if (isWriteProtected(failure)) {
        return deviceError(
            DeviceErrorCode::CannotUse,
            what +
                " cannot be written; make it and its directory writable, or use a copy of the "
                "device");
    }
    switch (failure.resultCode & 0xff) {
        case SQLITE_ERROR:  // a table or a column that every device has is not there
        case SQLITE_CORRUPT:
        case SQLITE_NOTADB:
            return deviceError(DeviceErrorCode::Damaged,
                               what + " is damaged (" + failure.reason +
                                   "); put a copy of the device in its place, or create a new "
                                   "device and sync it");
        case SQLITE_NOMEM:
            return deviceError(DeviceErrorCode::CannotUse,
                               "out of means: " + what +
                                   " cannot be used, as there is not enough memory; end other "
                                   "programs, and run it again");
        case SQLITE_BUSY:
        case SQLITE_LOCKED:
            return deviceError(DeviceErrorCode::InUse,
                               what +
                                   " has been held by another process for ten seconds; try again "
                                   "when that one is done");
        default:
            return deviceError(DeviceErrorCode::CannotUse,
                               what + " cannot be used: " + failure.reason + systemReason(failure) +
                                   "; check the disk and who may write there");
    }
}

}  // namespace

// Query

Query::Query(Database& database, sqlite3_stmt* statement, Status status)
    : database_(database), statement_(statement), status_(std::move(status)) {}

Query::Query(Query&& other) noexcept
    : database_(other.database_),
      statement_(std::exchange(other.statement_, nullptr)),
      status_(std::move(other.status_)),
      bound_(other.bound_) {}

Query::~Query() {
    if (statement_ == nullptr) return;
    sqlite3_reset(statement_);
    sqlite3_clear_bindings(statement_);
}

void Query::check(int resultCode) {
    if (resultCode != SQLITE_OK && status_) status_ = database_.error(resultCode);
}

void Query::bindNext(std::int64_t value) {
    if (status_) check(sqlite3_bind_int64(statement_, ++bound_, value));
}

void Query::bindNext(std::string_view value) {
    if (!status_) return;
    // A null pointer would bind the null value.
    const char* bytes = value.data() == nullptr ? "" : value.data();
    check(sqlite3_bind_text64(statement_, ++bound_, bytes, value.size(), SQLITE_TRANSIENT,
                              SQLITE_UTF8));
}

void Query::bindNext(ByteView value) {
    if (!status_) return;
    const void* bytes = value.empty() ? static_cast<const void*>("") : value.data();
    check(sqlite3_bind_blob64(statement_, ++bound_, bytes, value.size(), SQLITE_TRANSIENT));
}

void Query::bindNext(std::nullopt_t) {
    if (status_) check(sqlite3_bind_null(statement_, ++bound_));
}

bool Query::next() {
    if (!status_) return false;
    const int resultCode = sqlite3_step(statement_);
    if (resultCode == SQLITE_ROW) return true;
    if (resultCode != SQLITE_DONE) status_ = database_.error(resultCode);
    return false;
}

Status Query::run() {
    while (next()) continue;
    return status_;
}

std::int64_t Query::integer(int column) const { return sqlite3_column_int64(statement_, column); }

std::uint64_t Query::unsignedInteger(int column) const {
    return static_cast<std::uint64_t>(integer(column));
}

std::string Query::text(int column) const { return optionalText(column).value_or(std::string()); }

std::optional<std::string> Query::optionalText(int column) const {
    const unsigned char* text = sqlite3_column_text(statement_, column);
    if (text == nullptr) return std::nullopt;
    const auto size = static_cast<std::size_t>(sqlite3_column_bytes(statement_, column));
    return std::string(reinterpret_cast<const char*>(text), size);
}

Bytes Query::blob(int column) const {
    const auto* bytes = static_cast<const std::uint8_t*>(sqlite3_column_blob(statement_, column));
    if (bytes == nullptr) return {};
    return {bytes, bytes + sqlite3_column_bytes(statement_, column)};
}

// Database

Result<std::unique_ptr<Database>> Database::open(const std::string& path, Mode mode) {
    return openNamed(path, path, mode);
}

Result<std::unique_ptr<Database>> Database::openCopy(const std::string& copy,
                                                     const std::string& original) {
    return openNamed(copy, original, Mode::Alone);
}

Result<std::unique_ptr<Database>> Database::openNamed(const std::string& path,
                                                      const std::string& name, Mode mode) {
    sqlite3* handle = nullptr;
    const int creation = mode == Mode::Create ? SQLITE_OPEN_CREATE : 0;
    const int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_EXRESCODE;
    const int resultCode =
        sqlite3_open_v2(path.c_str(), &handle, flags | creation, joinedLogLayer());
    std::unique_ptr<Database> database(new Database(handle, name));
    if (resultCode != SQLITE_OK) return database->error(resultCode);
    sqlite3_busy_timeout(handle, kBusyTimeoutMilliseconds);
    sqlite3_db_config(handle, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
    // A device's database has neither; what somebody put into it does not run.
    sqlite3_db_config(handle, SQLITE_DBCONFIG_ENABLE_TRIGGER, 0, nullptr);
    sqlite3_db_config(handle, SQLITE_DBCONFIG_ENABLE_VIEW, 0, nullptr);
    Status status = database->execute("PRAGMA foreign_keys = ON; PRAGMA trusted_schema = OFF;");
    // Before the first access, so that the log's index is kept in memory.
    if (status && mode == Mode::Alone)
        status = database->execute("PRAGMA locking_mode = EXCLUSIVE");
    if (!status) return status.error();
    return database;
}

Database::Database(sqlite3* handle, std::string path) : handle_(handle), path_(std::move(path)) {
    if (handle_ == nullptr) return;
    sqlite3_rollback_hook(
        handle_, [](void* self) { static_cast<Database*>(self)->noteLoss(); }, this);
}

Database::~Database() {
    for (const auto& [sql, statement] : statements_) sqlite3_finalize(statement);
    sqlite3_close(handle_);
}

Query Database::query(const char* sql) {
    sqlite3_stmt*& statement = statements_[sql];
    if (statement != nullptr) return {*this, statement, {}};
    const int resultCode =
        sqlite3_prepare_v3(handle_, sql, -1, SQLITE_PREPARE_PERSISTENT, &statement, nullptr);
    if (resultCode == SQLITE_OK) return {*this, statement, {}};
    statements_.erase(sql);
    return {*this, nullptr, error(resultCode)};
}

Status Database::execute(const char* sql) {
    const int resultCode = sqlite3_exec(handle_, sql, nullptr, nullptr, nullptr);
    if (resultCode == SQLITE_OK) return {};
    return error(resultCode);
}

Result<std::int64_t> Database::integer(const char* sql) {
    Query rows = query(sql);
    const std::int64_t value = rows.next() ? rows.integer(0) : 0;
    if (Status status = rows.status(); !status) return status.error();
    return value;
}

bool Database::inTransaction() const { return sqlite3_get_autocommit(handle_) == 0; }

void Database::undoSince(const char* rollback) {
    noteLoss();
    query(rollback).run().ignore();
}

std::size_t Database::changedRows() const {
    return static_cast<std::size_t>(sqlite3_changes64(handle_));
}

ErrorRecord Database::error(int resultCode) const {
    if (handle_ == nullptr)
        return databaseError({resultCode, 0, sqlite3_errstr(resultCode), path_});
    // Asked for first: asking for the reason changes it.
    const std::string reason = sqlite3_errmsg(handle_);
    return databaseError({resultCode, systemErrorOf(handle_), reason, path_});
}

}  // namespace appsync
