#pragma once

#include <string>

namespace appsync {

struct ErrorRecord;

/// What an install failed of, for whoever looks at the device later: without the path that its
/// package had there, which has gone with the failure.
[[nodiscard]] std::string failureText(const std::string& identifier, const ErrorRecord& error);

}  // namespace appsync
