#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>

#include "platform/Bytes.h"
#include "platform/Result.h"

struct sqlite3;
struct sqlite3_stmt;

namespace appsync {

class Database;

/// One use of a statement: bind, then walk the rows or run it. What goes wrong on the way is kept,
/// skips the rest, and is told at the end by `run` or `status`.
class Query {
  public:
    Query(Query&& other) noexcept;
    Query(const Query&) = delete;
    Query& operator=(const Query&) = delete;
    Query& operator=(Query&&) = delete;
    ~Query();

    /// Binds the next parameters, in order.
    template <typename... Values>
    Query& bind(const Values&... values) {
        (bindNext(values), ...);
        return *this;
    }

    /// Goes to the next row. False at the end and on failure.
    [[nodiscard]] bool next();
    /// Walks to the end.
    Status run();
    [[nodiscard]] Status status() const { return status_; }

    // The columns of the row, from 0. A null reads as 0 or as empty.
    [[nodiscard]] std::int64_t integer(int column) const;
    [[nodiscard]] std::uint64_t unsignedInteger(int column) const;
    [[nodiscard]] std::string text(int column) const;
    [[nodiscard]] std::optional<std::string> optionalText(int column) const;
    [[nodiscard]] Bytes blob(int column) const;

  private:
    friend class Database;
    Query(Database& database, sqlite3_stmt* statement, Status status);

    void bindNext(std::int64_t value);
    void bindNext(std::uint64_t value) { bindNext(static_cast<std::int64_t>(value)); }
    void bindNext(bool value) { bindNext(static_cast<std::int64_t>(value)); }
    void bindNext(std::string_view value);
    void bindNext(const std::string& value) { bindNext(std::string_view(value)); }
    void bindNext(const char* value) { bindNext(std::string_view(value)); }
    void bindNext(ByteView value);
    void bindNext(const Bytes& value) { bindNext(ByteView(value)); }
    void bindNext(std::nullopt_t value);
    template <typename Value>
    void bindNext(const std::optional<Value>& value) {
        value ? bindNext(*value) : bindNext(std::nullopt);
    }
    void check(int resultCode);

    Database& database_;
    sqlite3_stmt* statement_;
    Status status_;
    int bound_ = 0;
};

/// A connection to an SQLite database. One thread at a time may use it. Failures are errors of
/// `kDeviceErrorDomain`.
class Database {
  public:
    enum class Mode {
        Create,
        Existing,
        /// An existing one, and nobody else has it open meanwhile: whoever comes waits. Needs no
        /// shared memory file, so a full disk can be looked at. Fails as a database that is in use
        /// where another connection stays for ten seconds.
        Alone,
    };

    /// Creates the file or opens an existing one. Waits up to ten seconds where another connection
    /// holds what a statement needs.
    [[nodiscard]] static Result<std::unique_ptr<Database>> open(const std::string& path, Mode mode);
    /// The same of a copy; messages name the original.
    [[nodiscard]] static Result<std::unique_ptr<Database>> openCopy(const std::string& copy,
                                                                    const std::string& original);
    ~Database();
    Database(const Database&) = delete;
    Database& operator=(const Database&) = delete;

    /// A use of the statement, which is compiled once. `sql` must live as long as the database.
    [[nodiscard]] Query query(const char* sql);
    /// Runs statements that give no rows.
    Status execute(const char* sql);

    /// The first column of the first row; 0 when there is none.
    [[nodiscard]] Result<std::int64_t> integer(const char* sql);

    /// Whether a transaction is open.
    [[nodiscard]] bool inTransaction() const;
    /// How often what was written has not been kept: a transaction, or a part of one, was undone.
    [[nodiscard]] std::uint64_t losses() const noexcept { return losses_; }
    /// Counts one that only the caller knows of.
    void noteLoss() noexcept { ++losses_; }
    /// Undoes what was written since that savepoint.
    void undoSince(const char* rollback);
    /// Rows that the last statement changed.
    [[nodiscard]] std::size_t changedRows() const;
    [[nodiscard]] const std::string& path() const noexcept { return path_; }

  private:
    friend class Query;
    Database(sqlite3* handle, std::string path);

    [[nodiscard]] static Result<std::unique_ptr<Database>> openNamed(const std::string& path,
                                                                     const std::string& name,
                                                                     Mode mode);

    [[nodiscard]] ErrorRecord error(int resultCode) const;

    sqlite3* handle_;
    const std::string path_;
    std::unordered_map<const char*, sqlite3_stmt*> statements_;
    std::uint64_t losses_ = 0;
};

}  // namespace appsync
