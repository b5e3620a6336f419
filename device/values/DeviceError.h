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
    CannotUse = 8,      // the operating system refuses: permissions ...
    NoSpace = 9,        // the disk is full
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
    Running = 10,            // it runs, and its termination is denied
    NothingKept = 11,        // no earlier version of it is kept
};

/// Domain of errors of a device's coordination service.
inline constexpr std::string_view kCoordinationErrorDomain = "InstallCoordination";

/// The codes of `kCoordinationErrorDomain`. 1 to 9 are those of `userPresentableError`.
enum class CoordinationErrorCode : std::int64_t {
    OtherKind = 10,      // a coordinator of another kind stands in the way
    AlreadyExists = 11,  // a coordinator stands already
    NotInstalled = 12,   // an update of what is not installed
    NoCoordinator = 13,  // there is none
    NotEnabled = 14,     // the device's installs are not coordinated
    AlreadySet = 15,     // the piece is there already
    Refused = 16,        // a piece that cannot be used
    Over = 17,           // the coordinator is done or cancelled, or the service is closed
    Cancelled = 18,      // somebody cancelled the install
};

[[nodiscard]] ErrorRecord coordinationError(CoordinationErrorCode code, std::string_view sentence);
[[nodiscard]] ErrorRecord deviceError(DeviceErrorCode code, std::string_view sentence);
[[nodiscard]] ErrorRecord registryError(RegistryErrorCode code, std::string_view sentence);
[[nodiscard]] bool isDeviceError(const ErrorRecord& error, DeviceErrorCode code) noexcept;
[[nodiscard]] bool isRegistryError(const ErrorRecord& error, RegistryErrorCode code) noexcept;

}  // namespace appsync
