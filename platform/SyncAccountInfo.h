#pragma once

#include <compare>
#include <cstdint>
#include <optional>
#include <string>

namespace appsync {

/// The SyncHost's account record: one per distinct store account.
struct SyncAccountInfo {
    std::string accountID;
    std::optional<std::int64_t> personID;
    std::optional<std::string> alternatePersonID;

    /// By account identifier first.
    // clang-tidy 14 takes the 0 in what the compiler makes of this for a pointer.
    // NOLINTNEXTLINE(modernize-use-nullptr)
    friend auto operator<=>(const SyncAccountInfo&, const SyncAccountInfo&) = default;
};

}  // namespace appsync
