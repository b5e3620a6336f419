#pragma once

#include <set>
#include <string>

#include "platform/PropertyList.h"
#include "tests/reliability/World.h"

namespace appsync {

/// What the host is to do in a session.
struct HostPlan {
    /// What it stages.
    PropertyList todoList;
    /// Whose packages an interrupted session has delivered: they are not sent again.
    std::set<std::string> arrived;
};

/// What the desktop host does between the opening of the device and the session: it plans with the
/// code of host/, cancels the coordinators that lead nowhere, takes away the placeholders that an
/// interrupted sync has left, and clears received files. `wanted` is what a todo list would ask of
/// an untouched device.
[[nodiscard]] HostPlan planSession(World& world, const PropertyList& wanted);

/// What it does when everything else of the session has ended: a coordinator that was taken up and
/// still lacks something is cancelled.
void cancelWhatWasTakenUp(World& world, const HostPlan& plan);

}  // namespace appsync
