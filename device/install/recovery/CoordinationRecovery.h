#pragma once

#include <string>
#include <unordered_set>

#include "platform/Result.h"

namespace appsync {

struct InstallContext;

/// Makes coordinators and placeholders fit together again, when a session begins and before any of
/// it is used:
///
/// - a coordinator whose placeholder stood on the home screen and is lost goes;
/// - a sync's placeholder without a coordinator goes;
/// - a restored one without a coordinator, from when installs were not coordinated, gets one, as
///   if it had been restored since: the store is to bring its package, and its data counts as
///   there;
/// - where the device's installs are no longer coordinated, every coordinator goes, with its
///   placeholder, and the placeholders of syncs are left to those.
Status reconcileCoordinators(const InstallContext& context);

/// The device paths of the files that coordinators have been delivered and have yet to use.
[[nodiscard]] Result<std::unordered_set<std::string>> deliveredFiles(const InstallContext& context);

}  // namespace appsync
