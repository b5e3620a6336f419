#pragma once

#include <cstdint>
#include <string>

namespace appsync {

/// Space that a device keeps for the day when its disk is full: a file beside its database that is
/// given up when something is to be removed, which takes a little space before it gives any back.

/// What has to be free where a device is made: less would not do for the reserve and the first use.
inline constexpr std::uint64_t kSpaceOfNewDevice = std::uint64_t{512} << 10U;

/// Makes the file in a new device. False where there is no room for it. Where the file system
/// cannot keep space back for a file, there is none, and it is true.
[[nodiscard]] bool makeSpaceReserve(const std::string& devicePath) noexcept;

/// Makes the file where there is none, or lets a smaller one grow: whole where plenty of space is
/// free, else as much as a removal needs, as long as that much is there. What was borrowed is kept
/// again as far as there is room. May do nothing.
void keepSpaceReserve(const std::string& devicePath, std::uint64_t borrowed = 0) noexcept;

/// Gives the file up where less space is left than it takes. Gives what it took; 0
/// where nothing was given up.
std::uint64_t giveUpSpaceReserveIfFull(const std::string& devicePath) noexcept;

/// What the file takes; 0 where there is none.
[[nodiscard]] std::uint64_t spaceReserveOf(const std::string& devicePath) noexcept;

}  // namespace appsync
