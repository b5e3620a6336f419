#pragma once

// host/command/argument: what the words stand for that every command is given: a device, an
// application, a file to write. Called by the rooms of host/command.

#include <functional>
#include <memory>
#include <string>

#include "device/Device.h"
#include "platform/Result.h"

namespace appsync {

struct Console;

/// Whether a device stands there, or what is left of one.
[[nodiscard]] bool looksLikeDevice(const std::string& path);

/// Opens a device for a command; the error has the exit status "unusable".
[[nodiscard]] Result<std::unique_ptr<Device>> openDevice(const std::string& path,
                                                         DeviceAccess access);

/// The same with all that there is to say.
[[nodiscard]] Result<std::unique_ptr<Device>> openDevice(const std::string& path,
                                                         const DeviceOpenOptions& options);

/// The error of an operation on a device: when it tells that the device itself cannot be used, one
/// with that exit status; else as it is.
[[nodiscard]] ErrorRecord classified(const ErrorRecord& error);

/// What a command does with a device that is open.
using WorkOnDevice = std::function<Status(Device& device)>;

/// Opens a device for looking and hands it on. Gives the exit status.
[[nodiscard]] int lookAt(const std::string& path, const Console& console, const WorkOnDevice& look);

}  // namespace appsync
