#pragma once

#include <chrono>
#include <functional>
#include <optional>
#include <string>

#include "platform/Result.h"

namespace appsync {

/// What came of an action that another process was given.
struct TrialOutcome {
    /// Nothing where the process ended before it, or told more than 64 KiB.
    std::optional<std::string> answer;
    /// How it ended: "signal 11", "status 3".
    std::string end;
    /// It had not ended within the limit, and was killed.
    bool isOverdue = false;
};

/// Has a copy of this process do `action`, and waits for its end, but no longer than `limit`. The
/// copy has no other thread, the standard streams lead it nowhere, and it leaves no dump; whatever
/// the action does to it, this process stays as it is. An error only where there can be no copy.
[[nodiscard]] Result<TrialOutcome> tryInAnotherProcess(const std::function<std::string()>& action,
                                                       std::chrono::milliseconds limit);

}  // namespace appsync
