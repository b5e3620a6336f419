#pragma once

#include <string>
#include <string_view>

#include <sys/stat.h>

#include "platform/Bytes.h"
#include "platform/Result.h"
#include "system/file/RootDirectory.h"
#include "system/file/UniqueFd.h"

namespace appsync {

/// Whether the name is one that `TemporaryFile` gives to what is to become NAME: a dot, NAME, and
/// ".appsync-XXXXXX", where each X is a small letter or a digit; a long NAME is cut short.
[[nodiscard]] bool isTemporaryName(std::string_view name);

/// Removes the temporary file `name` of the open directory unless a living process is writing it.
/// Gives an errno value, or 0.
[[nodiscard]] int removeIfStale(int directory, const std::string& name);

/// A file that takes the place of another when it is complete:
///
///     create, write*, sync?, commit
///
/// It stands in the directory of its target and is locked while it lives, so that nobody takes it
/// for a leftover. What is not committed is removed on destruction. Used by one thread at a time.
class TemporaryFile {
  public:
    /// Makes one for the target at a device path. It gets the permissions and the owner of the file
    /// that it is to replace, where there is one and the system permits.
    [[nodiscard]] static Result<TemporaryFile> create(const RootDirectory& root,
                                                      const std::string& path);
    /// The same for a target that was looked up already; `path` is for errors.
    [[nodiscard]] static Result<TemporaryFile> create(ItemPlace place, const std::string& path);

    TemporaryFile(TemporaryFile&& other) noexcept;
    TemporaryFile& operator=(TemporaryFile&&) = delete;
    TemporaryFile(const TemporaryFile&) = delete;
    TemporaryFile& operator=(const TemporaryFile&) = delete;
    ~TemporaryFile();

    /// The open file; still owned.
    [[nodiscard]] int descriptor() const noexcept { return file_.get(); }
    /// What it was when it was made, and whose it is.
    [[nodiscard]] const struct stat& status() const noexcept { return status_; }

    /// Appends. After a failure the file is good for nothing but to be destroyed.
    Status write(ByteView contents);
    /// Brings what was written to the disk; after a failure, as above.
    Status sync();
    /// Puts the file in the target's place, in one step.
    Status commit();

  private:
    TemporaryFile(ItemPlace place, std::string path)
        : place_(std::move(place)), path_(std::move(path)) {}

    int open();
    int openOnce();
    bool isStillLinked();
    void inheritFromTarget();

    ItemPlace place_;
    std::string path_;
    std::string temporaryName_;  // empty when there is nothing to remove
    UniqueFd file_;
    struct stat status_ {};
};

}  // namespace appsync
