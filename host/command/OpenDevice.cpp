#include "host/command/OpenDevice.h"

#include "device/values/DeviceError.h"
#include "host/console/Problem.h"

namespace appsync {

Result<std::unique_ptr<Device>> openDevice(const std::string& path, DeviceAccess access) {
    return openDevice(path, {.access = access});
}

Result<std::unique_ptr<Device>> openDevice(const std::string& path,
                                           const DeviceOpenOptions& options) {
    Result<std::unique_ptr<Device>> device = Device::open(path, options);
    if (!device) return unusable(device.error());
    return device;
}

ErrorRecord classified(const ErrorRecord& error) {
    return error.domain == kDeviceErrorDomain ? unusable(error) : error;
}

}  // namespace appsync
