#include "host/compare/Comparison.h"

#include <algorithm>
#include <set>
#include <utility>

#include "host/compare/DataSum.h"

namespace appsync {
namespace {

// A backup and a library say less of an application than a device does, and where installs are not
// coordinated, a restore makes the same placeholder of each.
bool canBeTheSame(HeldState left, HeldState right) {
    if (left == right) return true;
    const auto areBoth = [&](HeldState one, HeldState other) {
        return (left == one && right == other) || (left == other && right == one);
    };
    return areBoth(HeldState::BackedUp, HeldState::Installed) ||
           areBoth(HeldState::BackedUp, HeldState::Restored) ||
           areBoth(HeldState::BackedUp, HeldState::Package) ||
           areBoth(HeldState::BackedUpOffloaded, HeldState::Offloaded) ||
           areBoth(HeldState::BackedUpOffloaded, HeldState::Restored) ||
           areBoth(HeldState::Package, HeldState::Installed);
}

using ComparisonProgress = std::function<void(const std::string& identifier, std::uint64_t bytes)>;

class Comparing {
  public:
    Comparing(const Holdings& left, const Holdings& right, const ComparisonProgress& progress)
        : left_(left), right_(right), progress_(progress) {}

    Comparison run() {
        comparison_.unreadable = left_.unreadable;
        comparison_.unreadable.insert(comparison_.unreadable.end(), right_.unreadable.begin(),
                                      right_.unreadable.end());
        compareApplications();
        if (left_.order && right_.order) compareOrder();
        return std::move(comparison_);
    }

  private:
    void compareApplications() {
        for (const auto& [identifier, application] : left_.applications) {
            if (!counts(application)) continue;
            const auto other = right_.applications.find(identifier);
            if (other == right_.applications.end()) {
                comparison_.onlyLeft.push_back(identifier);
            } else {
                compare(identifier, application, other->second);
            }
        }
        for (const auto& [identifier, application] : right_.applications) {
            if (!counts(application) || left_.applications.contains(identifier)) continue;
            comparison_.onlyRight.push_back(identifier);
        }
    }

    [[nodiscard]] bool counts(const HeldApplication& application) const {
        return !application.isOfSystem ||
               (left_.kind == HoldingsKind::Device && right_.kind == HoldingsKind::Device);
    }

    void compare(const std::string& identifier, const HeldApplication& left,
                 const HeldApplication& right) {
        ApplicationDifference difference{identifier};
        difference.inVersion = left.version != right.version;
        difference.inState = !canBeTheSame(left.state, right.state);
        difference.inData = differsInData(identifier);
        if (difference.any()) comparison_.different.push_back(std::move(difference));
    }

    bool differsInData(const std::string& identifier) {
        if (left_.kind == HoldingsKind::Library || right_.kind == HoldingsKind::Library) {
            return false;
        }
        const std::optional<std::string> left = dataSumIn(left_, identifier);
        const std::optional<std::string> right = dataSumIn(right_, identifier);
        return left && right && *left != *right;
    }

    std::optional<std::string> dataSumIn(const Holdings& side, const std::string& identifier) {
        Result<std::string> sum =
            sumOfData(side, identifier, [&](std::uint64_t bytes) { progress_(identifier, bytes); });
        if (sum) return *std::move(sum);
        comparison_.unreadable.push_back({identifier, sum.error().description()});
        return std::nullopt;
    }

    // What one side alone has says nothing of the order of the others.
    void compareOrder() {
        comparison_.isSameOrder = common(left_, right_) == common(right_, left_);
    }

    static std::vector<std::string> common(const Holdings& side, const Holdings& other) {
        const std::set<std::string> known(other.order->begin(), other.order->end());
        std::vector<std::string> both;
        for (const std::string& identifier : *side.order) {
            const bool isHeld =
                side.applications.contains(identifier) && other.applications.contains(identifier);
            if (isHeld && known.contains(identifier)) both.push_back(identifier);
        }
        return both;
    }

    const Holdings& left_;
    const Holdings& right_;
    const ComparisonProgress& progress_;
    Comparison comparison_;
};

}  // namespace

Comparison compareHoldings(const Holdings& left, const Holdings& right,
                           const ComparisonProgress& progress) {
    return Comparing(left, right, progress).run();
}

}  // namespace appsync
