#pragma once

#include <functional>
#include <string>

#include "host/session/PackageSender.h"
#include "host/session/Session.h"
#include "platform/Result.h"

namespace appsync {

class Device;
class InstallCoordinator;
class InstallCoordinatorService;
class SessionFacts;
struct ApplicationRecord;
struct LibraryPackage;

// What the app store does on a device whose installs are coordinated.

/// Whether it is an application of the system of which only the placeholder is left. The plug-in
/// never asks for its package: whoever brings it brings it unasked.
[[nodiscard]] bool isOffloadedSystemApplication(const ApplicationRecord& application);

/// Has a coordinator wait for the package of an offloaded application, as the store's task. Its
/// placeholder goes on standing, whatever comes of it. An error, and nothing changed, when another
/// client has its install in hand.
Status awaitPackage(InstallCoordinatorService& service, const ApplicationRecord& application);

/// Sends a package and keeps the promise of it that the coordinator has, or gets now. Gives the
/// number of bytes; the device installs it.
[[nodiscard]] Result<std::uint64_t> deliverFromStore(InstallCoordinatorService& service,
                                                     InstallCoordinator& coordinator,
                                                     const LibraryPackage& package,
                                                     PackageSender& sender,
                                                     const PackageSender::Progress& progress);

/// Brings one offloaded application of the system back as the store would, in the place of a
/// session with the plug-in, and waits for its install; `facts` hears what becomes of it. The
/// package is null where it waits on the device already. `stopRequested` is asked now and then.
SessionEnd bringBack(Device& device, InstallCoordinatorService& service,
                     const ApplicationRecord& application, const LibraryPackage* package,
                     SessionFacts& facts, const std::function<bool()>& stopRequested);

}  // namespace appsync
