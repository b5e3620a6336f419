#pragma once

#include <memory>
#include <string>

#include "device/Device.h"
#include "platform/Result.h"

namespace appsync {

/// Opens a device for a command; the error has the exit status "unusable".
[[nodiscard]] Result<std::unique_ptr<Device>> openDevice(const std::string& path,
                                                         DeviceAccess access);

/// The same with all that there is to say.
[[nodiscard]] Result<std::unique_ptr<Device>> openDevice(const std::string& path,
                                                         const DeviceOpenOptions& options);

/// The error of an operation on a device: when it tells that the device itself cannot be used, one
/// with that exit status; else as it is.
[[nodiscard]] ErrorRecord classified(const ErrorRecord& error);

}  // namespace appsync
