#pragma once

#include <cstdint>
#include <cstdlib>
#include <optional>
#include <string>

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define APPSYNC_IS_SANITIZED true
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
#define APPSYNC_IS_SANITIZED true
#endif
#endif
#ifndef APPSYNC_IS_SANITIZED
#define APPSYNC_IS_SANITIZED false
#endif

namespace appsync {

/// Sanitizers take ten times as long, and look for something else: there the sweeps are shorter.
inline constexpr bool kIsSanitized = APPSYNC_IS_SANITIZED;

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
