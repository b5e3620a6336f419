#include "device/values/DeviceError.h"

namespace appsync {

ErrorRecord deviceError(DeviceErrorCode code, std::string_view sentence) {
    return ErrorRecord::make(kDeviceErrorDomain, static_cast<std::int64_t>(code), sentence);
}

ErrorRecord registryError(RegistryErrorCode code, std::string_view sentence) {
    return ErrorRecord::make(kRegistryErrorDomain, static_cast<std::int64_t>(code), sentence);
}

ErrorRecord coordinationError(CoordinationErrorCode code, std::string_view sentence) {
    return ErrorRecord::make(kCoordinationErrorDomain, static_cast<std::int64_t>(code), sentence);
}

bool isDeviceError(const ErrorRecord& error, DeviceErrorCode code) noexcept {
    return error.domain == kDeviceErrorDomain && error.code == static_cast<std::int64_t>(code);
}

bool isRegistryError(const ErrorRecord& error, RegistryErrorCode code) noexcept {
    return error.domain == kRegistryErrorDomain && error.code == static_cast<std::int64_t>(code);
}

}  // namespace appsync
