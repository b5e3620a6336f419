#pragma once

#include <map>
#include <string>
#include <vector>

#include "tests/reliability/World.h"

namespace appsync {

/// What is on a device between two sessions, each thing with a name: applications and placeholders
/// with their versions, coordinators, the icon layout, what awaits the host, and files, except
/// those that belong to the last session alone (its todo list, rendered icons) or are temporary.
using DeviceState = std::map<std::string, std::string>;

[[nodiscard]] DeviceState stateOf(World& world);

/// A line for each thing in which a state differs from the expected one.
[[nodiscard]] std::vector<std::string> differencesBetween(const DeviceState& expected,
                                                          const DeviceState& found);

}  // namespace appsync
