#pragma once

#include <string>
#include <vector>

#include "platform/Result.h"

namespace appsync {

class Device;
class InstallCoordinatorService;
struct Library;

/// A package that the store has not brought, or a file of its folder that is none.
struct FailedPromise {
    std::string identifier;
    std::string error;
};

/// What came of the store's promises.
struct StoreResult {
    std::vector<std::string> kept;
    std::vector<FailedPromise> failed;
};

/// Plays the app store in one session with a device: promises each package that it is responsible
/// for, keeps the promise with a package of its library, and waits for the installs, except for
/// those that wait for an application that runs. The device is open for a session; `service` is its
/// coordination service as the plug-in has it.
[[nodiscard]] Result<StoreResult> keepPromises(Device& device, const Library& library,
                                               InstallCoordinatorService& service);

}  // namespace appsync
