#pragma once

#include <optional>
#include <string>

#include "platform/Result.h"
#include "system/file/UniqueFd.h"

namespace appsync {

/// Holds a device for one session, until it is destroyed or the process ends in whatever way: an
/// advisory lock on the device directory.
class SessionLock {
  public:
    /// Takes the lock of the device at a path of this machine. Nothing when another session holds
    /// it.
    [[nodiscard]] static Result<std::optional<SessionLock>> take(const std::string& devicePath);

    /// Whether a session, this process's included, holds the device at this moment.
    [[nodiscard]] static bool isHeld(const std::string& devicePath);

  private:
    explicit SessionLock(UniqueFd directory) : directory_(std::move(directory)) {}

    UniqueFd directory_;
};

}  // namespace appsync
