#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "tests/reliability/RandomSession.h"

namespace appsync {

/// What it comes to when all of a session is put to rest that can be.
struct ReducedSession {
    /// None of its draws can be left out alone.
    SessionChanges changes;
    /// What was broken in it.
    std::vector<std::string> violations;
    std::size_t applications = 0;
    /// How many sessions it took to find it.
    std::size_t tries = 0;
};

/// Fewest draws of `whole` with which it still fails, tried in halves, quarters and so on: first
/// the turns, then the faults, then the rest, until nothing can be left out.
[[nodiscard]] SessionChanges reduced(SessionChanges whole,
                                     const std::function<bool(const SessionChanges&)>& fails);

/// The session of a seed, otherwise as `given`, that fails, with the same fault as small as it
/// gets. Of a session that keeps all invariants no violation comes back.
[[nodiscard]] ReducedSession reducedSession(std::uint64_t seed, const SessionChanges& given = {});

}  // namespace appsync
