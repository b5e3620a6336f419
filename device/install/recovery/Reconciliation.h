#pragma once

// device/install/recovery: what puts a device in order before a session: after a crash (this
// header, with CoordinationRecovery.h), and from an update back to what it replaced (Rollback.h).
// Called by Device alone.

#include <string>
#include <vector>

#include "platform/Result.h"

namespace appsync {

struct InstallContext;

/// Puts a device in order that an interrupted session, or a loss of power, left: whatever neither
/// the database nor the disk can account for goes. Only while the session's lock is held. Gives one
/// sentence for each thing that a person may miss. Costs a look at the names of all containers.
[[nodiscard]] Result<std::vector<std::string>> reconcileDevice(const InstallContext& context);

/// Removes the packages in the public staging directory that nobody waits for: one that was
/// delivered to a coordinator, or whose data is yet to come, stays where it lies; any other is sent
/// again. Only while the session's lock is held.
void clearPackages(const InstallContext& context);

/// Says in the database that this process's session holds the device.
Status beginSession(const InstallContext& context);

/// Makes everything durable and says that the session is over.
Status endSession(const InstallContext& context);

}  // namespace appsync
