#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "device/SessionLock.h"
#include "device/database/DeviceDatabase.h"
#include "platform/Result.h"
#include "system/file/RootedFileSystem.h"

namespace appsync {

/// The parts of a device directory, checked and open.
struct OpenedDevice {
    std::string path;                 // absolute
    std::optional<SessionLock> lock;  // of a session
    std::unique_ptr<RootedFileSystem> files;
    std::unique_ptr<DeviceDatabase> database;
    /// What of the space that the device keeps for a full disk was given up; it is to come back.
    std::uint64_t givenUpReserve = 0;
};

/// What a device is opened for; see DeviceOpenOptions.
struct OpeningNeeds {
    bool session = false;
    bool makesRoom = false;
    bool borrowsRoom = false;
    bool sparesKept = false;
};

/// Opens a device directory. With `session` it takes the session's lock first, and reads the whole
/// database to see whether it is sound. On a full disk who makes or borrows room gives up the
/// space that the device keeps for that; so does a session where earlier versions of applications
/// are kept, and gives up those where that is not enough, unless it spares them. A process of
/// root's acts as the directory's owner from then on (system/ActingAccount.h). Errors are of
/// `kDeviceErrorDomain`.
[[nodiscard]] Result<OpenedDevice> openDevice(const std::string& path, const OpeningNeeds& needs);

/// The error as one that says that the device cannot be used; one that does already, as it is.
[[nodiscard]] ErrorRecord cannotUseDevice(const std::string& path, const ErrorRecord& cause);

}  // namespace appsync
