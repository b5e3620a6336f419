#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "host/compare/Holdings.h"

namespace appsync {

/// An application that both sides hold, and in what they differ there.
struct ApplicationDifference {
    std::string identifier;
    bool inVersion = false;
    bool inState = false;
    bool inData = false;

    [[nodiscard]] bool any() const { return inVersion || inState || inData; }
};

/// What differs between two sides.
struct Comparison {
    std::vector<std::string> onlyLeft;
    std::vector<std::string> onlyRight;
    std::vector<ApplicationDifference> different;
    /// Whether what both have on the home screen stands there in the same order; nothing where a
    /// side says nothing of that.
    std::optional<bool> isSameOrder;
    std::vector<UnreadableHolding> unreadable;

    [[nodiscard]] bool same() const {
        return onlyLeft.empty() && onlyRight.empty() && different.empty() &&
               isSameOrder.value_or(true);
    }
};

/// Compares two sides, each application by identifier, all lists sorted by it. Applications of the
/// system are compared on two devices alone, as nothing else holds any. Data is compared where both
/// sides have it: on devices and in backups. `progress` hears the size of each piece of it that was
/// read, and whose it is.
[[nodiscard]] Comparison compareHoldings(
    const Holdings& left, const Holdings& right,
    const std::function<void(const std::string& identifier, std::uint64_t bytes)>& progress);

}  // namespace appsync
