#pragma once

#include <compare>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>

namespace appsync {

/// A whole number that 64 bits hold: the unsigned kind only above what the signed one holds.
using PersonIdentifier = std::variant<std::int64_t, std::uint64_t>;

/// The SyncHost's account record: one per distinct store account.
struct SyncAccountInfo {
    std::string accountID;
    std::optional<PersonIdentifier> personID;
    std::optional<std::string> alternatePersonID;

    /// By account identifier first.
    // clang-tidy 14 takes the 0 in what the compiler makes of this for a pointer.
    // NOLINTNEXTLINE(modernize-use-nullptr)
    friend auto operator<=>(const SyncAccountInfo&, const SyncAccountInfo&) = default;
};

}  // namespace appsync
