#pragma once

#include <string>

#include "device/values/DeviceRecords.h"
#include "platform/Result.h"

namespace appsync {

struct InstallContext;

/// Puts the version that an application's last update has replaced in the place of the one that is
/// installed, which is what is kept from then on. The application's data stays as it is. The
/// commit of one transaction is the last step that counts: it is on disk when this returns. A
/// registry error when the application is not installed, runs or is being updated, and when
/// nothing is kept of it, or only what is damaged: that is removed. Only while the session's lock
/// is held.
[[nodiscard]] Result<RollbackRecord> rollBackApplication(const InstallContext& context,
                                                         const std::string& identifier);

}  // namespace appsync
