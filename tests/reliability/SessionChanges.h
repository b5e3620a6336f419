#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "simulation/scheduling/Chance.h"

namespace appsync {

/// What is otherwise in a session than its seed says.
struct SessionChanges {
    /// Of the draws that decide what there is and what is done, which calls fail, and who has a
    /// turn.
    ChanceChanges choices{};
    ChanceChanges faults{};
    ChanceChanges turns{};
    /// What decides the latter two in place of the session's seed.
    std::optional<std::uint64_t> faultSeed{};
    std::optional<std::uint64_t> turnSeed{};
};

/// "choices:1,5;new-choices:4=77;turns:;fault-seed:9": the draws that are kept, and those that are
/// replaced, each where there is something to be said.
[[nodiscard]] std::string textOf(const SessionChanges& changes);
/// The same back; throws std::invalid_argument for any other text.
[[nodiscard]] SessionChanges changesOf(std::string_view text);

}  // namespace appsync
