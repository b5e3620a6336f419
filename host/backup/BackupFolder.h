#pragma once

#include <string>
#include <utility>

#include "platform/Bytes.h"
#include "platform/Result.h"
#include "system/file/UniqueFd.h"

namespace appsync {

/// The folder of a backup in the making. Until the backup is whole it holds an unfinished manifest,
/// which is locked as long as somebody writes the backup: what a backup that was cut off has left
/// is known by it, and is cleared by the next backup of the same name.
class BackupFolder {
  public:
    /// Makes the folder, or takes one that is empty or that a backup was cut off in. What cannot be
    /// used as it is stays untouched.
    [[nodiscard]] static Result<BackupFolder> make(const std::string& path);

    [[nodiscard]] const std::string& path() const noexcept { return path_; }

    /// Puts everything on disk, and only then gives the manifest its name: the backup is whole from
    /// now on.
    [[nodiscard]] Status finish(ByteView manifest);

  private:
    BackupFolder(std::string path, UniqueFd manifest)
        : path_(std::move(path)), manifest_(std::move(manifest)) {}

    std::string path_;
    UniqueFd manifest_;
};

}  // namespace appsync
