#pragma once

#include <functional>
#include <optional>
#include <string>

#include "platform/Result.h"
#include "system/file/UniqueFd.h"

namespace appsync {

/// Why a database cannot be used where it stands: which of the files that even a reader writes, or
/// the directory that they stand in, this process may not write. Nothing where it may, and where
/// there is no database.
[[nodiscard]] std::optional<ErrorRecord> whyNotWritable(const std::string& path);

/// A copy of a database in a private directory of its own, for those who may only read it: what is
/// committed, while others go on writing. The directory goes with this object; who has read of the
/// copy by then can use it all the same. One that a killed process has left goes with the next.
class DatabaseCopy {
  public:
    /// What others may do between the copies of the two files; tests say it.
    using Interlude = std::function<void()>;

    /// Nothing is written beside the database. Errors are those of the system, or that others did
    /// not leave it alone for long enough.
    [[nodiscard]] static Result<DatabaseCopy> make(const std::string& path,
                                                   const Interlude& interlude = {});

    DatabaseCopy(DatabaseCopy&& other) noexcept;
    DatabaseCopy(const DatabaseCopy&) = delete;
    DatabaseCopy& operator=(const DatabaseCopy&) = delete;
    DatabaseCopy& operator=(DatabaseCopy&&) = delete;
    ~DatabaseCopy();

    /// Of the copy.
    [[nodiscard]] std::string path() const;

  private:
    DatabaseCopy(std::string directory, UniqueFd lock);

    std::string directory_;
    UniqueFd lock_;  // of the directory, which tells others that it is in use
};

}  // namespace appsync
