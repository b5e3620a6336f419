#pragma once

#include <string>

namespace appsync {

/// Space that a device keeps for the day when its disk is full: a file beside its database that is
/// given up when something is to be removed, which takes a little space before it gives any back.
/// Both may do nothing; neither fails.

/// Makes the file where there is none, and where that leaves plenty of space.
void keepSpaceReserve(const std::string& devicePath) noexcept;

/// Gives the file up where less space is left than it takes.
void giveUpSpaceReserveIfFull(const std::string& devicePath) noexcept;

}  // namespace appsync
