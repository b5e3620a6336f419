#pragma once

#include <string>

#include "host/session/PackageSender.h"
#include "platform/Result.h"

namespace appsync {

class InstallCoordinator;
class InstallCoordinatorService;
struct ApplicationRecord;
struct LibraryPackage;

// What the app store does on a device whose installs are coordinated.

/// Whether it is an application of the system of which only the placeholder is left. The plug-in
/// never asks for its package: whoever brings it brings it unasked.
[[nodiscard]] bool isOffloadedSystemApplication(const ApplicationRecord& application);

/// Has a coordinator wait for the package of an offloaded application, as the store's task. Its
/// placeholder goes on standing, whatever comes of it.
Status awaitPackage(InstallCoordinatorService& service, const ApplicationRecord& application);

/// Sends a package and keeps the promise of it that the coordinator has, or gets now. Gives the
/// number of bytes; the device installs it.
[[nodiscard]] Result<std::uint64_t> deliverFromStore(InstallCoordinatorService& service,
                                                     InstallCoordinator& coordinator,
                                                     const LibraryPackage& package,
                                                     PackageSender& sender,
                                                     const PackageSender::Progress& progress);

}  // namespace appsync
