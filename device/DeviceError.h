#pragma once

#include <cstdint>
#include <string_view>

#include "platform/Error.h"

namespace appsync {

/// Domain of errors that say why a device as a whole cannot be made or used.
inline constexpr std::string_view kDeviceErrorDomain = "Device";

/// The codes of `kDeviceErrorDomain`.
enum class DeviceErrorCode : std::int64_t {
    Missing = 1,        // nothing stands at the path
    NotADevice = 2,     // something else stands there
    HalfCreated = 3,    // a device whose creation did not finish
    NewerSchema = 4,    // made by a newer version of this program
    Damaged = 5,        // the database cannot be read
    InUse = 6,          // another session holds the device
    AlreadyExists = 7,  // creation only: something stands at the path already
    CannotUse = 8,      // the operating system refuses: permissions, a full disk ...
};

/// The codes of `kRegistryErrorDomain` of a device's registry.
enum class RegistryErrorCode : std::int64_t {
    IllegalIdentifier = 1,
    IllegalOptions = 2,
    NothingInstalled = 3,    // there is nothing under the identifier
    PlaceholderRefused = 4,  // the directory is no placeholder bundle of that identifier
    SystemApplication = 5,   // it cannot be removed
    UpdateUnderWay = 6,      // a placeholder covers the application
    InstallUnderWay = 7,     // a termination assertion is held on it
    DatabaseFailed = 8,      // the registry's own database failed
    Uninstalled = 9,         // a person uninstalled it while its install was under way
};

[[nodiscard]] ErrorRecord deviceError(DeviceErrorCode code, std::string_view sentence);
[[nodiscard]] ErrorRecord registryError(RegistryErrorCode code, std::string_view sentence);
[[nodiscard]] bool isDeviceError(const ErrorRecord& error, DeviceErrorCode code) noexcept;
[[nodiscard]] bool isRegistryError(const ErrorRecord& error, RegistryErrorCode code) noexcept;

}  // namespace appsync
