#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/Error.h"

namespace appsync {

struct StoredCoordinator;

/// The refusal of what an update that is under way stands in the way of, with what to do. `then` is
/// what is to be done afterwards: "roll it back".
[[nodiscard]] ErrorRecord updateIsUnderWay(const std::string& identifier,
                                           const std::optional<StoredCoordinator>& coordinator,
                                           std::string_view then);

}  // namespace appsync
