#pragma once

#include <cstdint>
#include <cstdlib>
#include <optional>
#include <string>

namespace appsync {

/// The environment variable that names one seed; those that say how many to try, from which on.
inline constexpr const char* kOneSeed = "APPSYNC_SEED";
inline constexpr const char* kManySeeds = "APPSYNC_SEEDS";
inline constexpr const char* kFirstSeed = "APPSYNC_FIRST_SEED";
/// What is otherwise in it (tests/reliability/SessionChanges.h).
inline constexpr const char* kChanges = "APPSYNC_CHANGES";

/// The number in an environment variable; nothing where it is not set.
inline std::optional<std::uint64_t> numberIn(const char* variable) {
    const char* text = std::getenv(variable);
    return text != nullptr ? std::optional<std::uint64_t>(std::stoull(text)) : std::nullopt;
}

}  // namespace appsync
