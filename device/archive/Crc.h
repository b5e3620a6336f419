#pragma once

#include <cstdint>

#include "platform/Bytes.h"

namespace appsync {

/// The CRC-32 of archives, of bytes that follow others whose CRC is given; 0 where none came
/// before.
[[nodiscard]] std::uint32_t continueCrc(std::uint32_t before, ByteView bytes) noexcept;

}  // namespace appsync
