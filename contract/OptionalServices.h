#pragma once

#include <string_view>

#include "contract/ContractKit.h"

namespace appsync {

/// What a person calls the service.
[[nodiscard]] std::string_view nameOf(OptionalService service);

/// What the plug-in does where the device lacks it: one sentence.
[[nodiscard]] std::string_view meaningOfAbsence(OptionalService service);

}  // namespace appsync
