#pragma once

#include <memory>
#include <optional>
#include <string>

#include "device/SessionLock.h"
#include "device/database/DeviceDatabase.h"
#include "platform/Result.h"
#include "system/RootedFileSystem.h"

namespace appsync {

/// The parts of a device directory, checked and open.
struct OpenedDevice {
    std::string path;                 // absolute
    std::optional<SessionLock> lock;  // of a session
    std::unique_ptr<RootedFileSystem> files;
    std::unique_ptr<DeviceDatabase> database;
};

/// Opens a device directory. With `session` it takes the session's lock first, and reads the whole
/// database to see whether it is sound; with `makesRoom` it gives up the space that the device
/// keeps for a full disk, if it is. A process of root's acts as the directory's owner from then on
/// (system/ActingAccount.h). Errors are of `kDeviceErrorDomain`.
[[nodiscard]] Result<OpenedDevice> openDevice(const std::string& path, bool session,
                                              bool makesRoom);

/// The error as one that says that the device cannot be used; one that does already, as it is.
[[nodiscard]] ErrorRecord cannotUseDevice(const std::string& path, const ErrorRecord& cause);

}  // namespace appsync
