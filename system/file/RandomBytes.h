#pragma once

#include <cstdint>
#include <span>

namespace appsync {

/// Fills at most 256 bytes with random ones; false where the system has none. A thread asks the
/// system for 256 at a time: good for names that are tried, not for secrets, as a process that is
/// forked goes on with the same.
[[nodiscard]] bool fillWithRandomBytes(std::span<std::uint8_t> bytes);

}  // namespace appsync
