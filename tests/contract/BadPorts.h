#pragma once

#include <vector>

#include "contract/ContractKit.h"

namespace appsync {

/// Simulated devices whose registry crashes, hangs (with every file closed, too) or throws when it
/// is asked whether something is installed, and one that says that nothing ever is.
[[nodiscard]] std::vector<ContractPort> badPorts();

}  // namespace appsync
