#pragma once

#include <string>
#include <string_view>

#include "host/plan/SyncPlan.h"
#include "host/watch/SyncEvents.h"

namespace appsync {

enum class JsonLayout {
    Indented,   // for one object of a command
    EventLine,  // on one line, marked as the event "summary" or "plan"
};

// One JSON text each, without a line end. Bytes that are not UTF-8 become U+FFFD.

[[nodiscard]] std::string jsonText(const SyncEvent& event);
[[nodiscard]] std::string jsonText(const SyncSummary& summary, JsonLayout layout);
[[nodiscard]] std::string jsonText(const SyncPlan& plan, const SpaceCheck& space,
                                   JsonLayout layout);
/// What a staging area asks for that a host has left, at this path of the device.
[[nodiscard]] std::string stagedJsonText(const SyncPlan& plan, std::string_view area,
                                         bool hasReplaced);

}  // namespace appsync
