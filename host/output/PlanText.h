#pragma once

#include <string>

#include "host/plan/SyncPlan.h"

namespace appsync {

/// What a sync would do, for people; ends with a line end.
[[nodiscard]] std::string planText(const SyncPlan& plan, const SpaceCheck& space);

}  // namespace appsync
