#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "platform/Result.h"

namespace appsync {

class Device;
class PlugIn;
struct BackupManifest;

/// An application that a restore does not bring back, a file of the backup that is no good, or
/// "restore", when nothing of it is done.
struct FailedRestore {
    std::string identifier;
    std::string error;
};

/// What stands on the home screen.
struct ShownApplication {
    std::string identifier;
    std::string name;
    std::optional<std::string> version;
    bool isPlaceholder = false;
};

/// What came of a restore.
struct RestoreResult {
    std::vector<std::string> restored;
    std::vector<std::string> kept;
    std::vector<FailedRestore> failed;
    std::vector<ShownApplication> screen;
};

/// Whether the plug-in brings applications back when it is told this type of restore.
[[nodiscard]] bool bringsApplications(std::int64_t type);

/// Hears what is being done: "placing data, 3 of 9". It may be empty.
using RestoreProgress = std::function<void(const std::string& what)>;

/// Places what a backup holds where the plug-in and the device look for it, has the plug-in turn
/// each application into a placeholder, and says what came of it. The device is open for a session,
/// and the plug-in is loaded for a restore. What is installed stays as it is. An error when the
/// device or the backup cannot be used at all.
[[nodiscard]] Result<RestoreResult> restoreBackup(const std::string& backup,
                                                  const BackupManifest& manifest, std::int64_t type,
                                                  Device& device, PlugIn& plugIn,
                                                  const RestoreProgress& progress = {});

}  // namespace appsync
