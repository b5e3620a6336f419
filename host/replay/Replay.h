#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "host/replay/RecordingReader.h"
#include "platform/PlugInTable.h"

namespace appsync {

/// Where a plug-in did something else than the recording says.
struct Divergence {
    std::uint64_t thread = 0;
    /// As `recordText` shows them.
    std::string expected;
    std::string came;
    /// The last ten of the thread before.
    std::vector<std::string> before;
};

/// How a replay ended.
struct ReplayOutcome {
    /// How many lines were replayed.
    std::size_t lines = 0;
    std::optional<Divergence> divergence;
    /// The recording is damaged in a way that shows only now.
    std::optional<ErrorRecord> damage;
};

/// Runs the plug-in of the table against the recording, in virtual time. A recording that is
/// anonymous lacks what that takes: it is refused. Calls are answered in the recorded order; where
/// the plug-in wants another order of calls of different threads it gets it if these do not touch
/// each other, unless `isStrict`.
///
/// After a divergence, or the end of a recording that is cut off, what the plug-in has made is left
/// as it is: its module must not be unloaded.
[[nodiscard]] Result<ReplayOutcome> replay(const RecordedSession& session, const PlugInTable& table,
                                           bool isStrict);

}  // namespace appsync
