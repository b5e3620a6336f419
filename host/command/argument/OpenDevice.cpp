#include "host/command/argument/OpenDevice.h"

#include <filesystem>
#include <system_error>

#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"

namespace appsync {

bool looksLikeDevice(const std::string& path) {
    std::error_code code;
    const std::filesystem::path directory(path);
    return std::filesystem::exists(directory / kDatabaseName, code) ||
           std::filesystem::exists(directory / kRootName / "var/mobile", code);
}

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

int lookAt(const std::string& path, const Console& console, const WorkOnDevice& look) {
    const Result<std::unique_ptr<Device>> device = openDevice(path, DeviceAccess::Look);
    if (!device) return console.fail(device.error());
    const Status status = look(**device);
    return status ? kExitDone : console.fail(classified(status.error()));
}

}  // namespace appsync
