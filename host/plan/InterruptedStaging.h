#pragma once

#include <optional>
#include <string_view>

#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

class Device;
struct SyncPlan;

/// The host's own record of what a session is for. It stands in the staging area, goes with it
/// wherever the plug-in takes it, and goes away with it: whatever replaces the area, or clears the
/// work area, ends what it says. No application can have this name.
inline constexpr std::string_view kHostRecordName = "Host session.plist";

/// What the record says of an area that a sync has written from a library.
[[nodiscard]] PropertyList hostRecordOfLibrary();

/// The todo list that takes up an interrupted session on a staging area: as it was staged, but
/// without what has been done. Nothing where no such session was interrupted, where an area waits
/// on the device, or where somebody has changed the list meanwhile.
[[nodiscard]] std::optional<PropertyList> interruptedTodoList(Device& device);

/// Puts the area of the interrupted session back where a host stages it, with that list, in which
/// what the device installs by itself (as the plan says) is not asked for.
Status stageAgain(Device& device, const PropertyList& todoList, const SyncPlan& plan);

/// Notes that a session on the area that waits begins with this list. From now on, until
/// `endStagedSession`, an end of this process is an interruption.
Status beginStagedSession(Device& device, PropertyList todoList);
void endStagedSession(Device& device);

/// What a host has asked for, and a session that brings its own staging area does away with.
enum class StagedWork { None, Waiting, Interrupted };
[[nodiscard]] StagedWork stagedWorkOn(Device& device);

}  // namespace appsync
