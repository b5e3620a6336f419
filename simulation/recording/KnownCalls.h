#pragma once

#include <string_view>

namespace appsync {

/// Whether a call of this name can ever be recorded: "AppRegistry.installPackage",
/// "WaitGroup#1.wait". A test that asks for any other has a slip of the pen in it.
[[nodiscard]] bool isKnownCall(std::string_view name);

/// Whether calls to a service of this name can ever be recorded: "AppRegistry", "WaitGroup#1".
[[nodiscard]] bool isKnownService(std::string_view name);

/// "WaitGroup" of "WaitGroup#1" (queues and their kin are numbered); any other name as it is.
[[nodiscard]] std::string_view withoutNumber(std::string_view service);

}  // namespace appsync
