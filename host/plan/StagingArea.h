#pragma once

#include <optional>
#include <set>
#include <string>
#include <string_view>

#include "host/plan/StepProgress.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

class Device;
struct Library;
struct SyncPlan;

/// The todo list of a plan: its removals, then its installs and updates.
[[nodiscard]] PropertyList todoListOf(const SyncPlan& plan);

/// Writes the staging area for the plan: the todo list, the icon layout, and a directory for each
/// application that is to come. It is built beside its place and then renamed, in the place of one
/// that stood there: whoever looks sees all of it or none. A package that cannot be read any more
/// gets no directory. On failure nothing stays. The steps of the progress are applications.
Status writeStagingArea(Device& device, const SyncPlan& plan, const Library& library,
                        const StepProgress& progress = {});

/// The same as a host leaves it for a session that comes later. Gives its path on the device.
[[nodiscard]] Result<std::string> stageForLater(Device& device, const SyncPlan& plan,
                                                const Library& library,
                                                const StepProgress& progress = {});

/// What a host left in the staging area of the device, or a session that was interrupted of it.
struct StagedTodoList {
    /// Null when there is none, or no usable one.
    PropertyList list;
    /// Why a staging area has no usable one.
    std::optional<std::string> error;
    /// It asks for more than a session can do: the device must not get to see it.
    bool isTooLarge = false;
    /// No area waits, and this is what an interrupted session has left to do.
    bool isTakenUp = false;

    /// Neither: nobody has staged anything.
    [[nodiscard]] bool isAbsent() const { return list.isNull() && !error && !isTakenUp; }
};
[[nodiscard]] StagedTodoList readStagedTodoList(Device& device);

/// The version that the area of that list has the name and icon of; nothing where it tells none.
[[nodiscard]] std::optional<std::string> stagedVersion(Device& device, const StagedTodoList& staged,
                                                       const std::string& identifier);

/// Removes what an interrupted session left among the received files: packages, but not those that
/// wait for their application's data nor those of the applications that have `arrived`, which are
/// the coordination service's; and a staging area that was not finished.
Status removeStaleTransfers(Device& device, const std::set<std::string>& arrived);

}  // namespace appsync
