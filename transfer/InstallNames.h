#pragma once

#include <cstdint>
#include <string>

namespace appsync {

// What messages call the registry's numbers. A number without a name is named as unknown.
[[nodiscard]] std::string installTypeName(std::uint64_t type);
[[nodiscard]] std::string installStateName(std::uint64_t state);
[[nodiscard]] std::string installPhaseName(std::uint64_t phase);

}  // namespace appsync
