#pragma once

#include <cstdint>
#include <span>
#include <vector>

namespace appsync {

/// Bytes that their holder owns.
using Bytes = std::vector<std::uint8_t>;

/// Bytes that somebody else owns, for the duration of a call.
using ByteView = std::span<const std::uint8_t>;

}  // namespace appsync
