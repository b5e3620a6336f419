#pragma once

#include <functional>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/InstallPromises.h"
#include "platform/Result.h"

namespace appsync {

class Device;
struct ApplicationRecord;
struct CoordinatorRecord;
struct SyncPlan;

/// What an earlier session, or somebody else, has left with the device's coordination service.
struct StandingInstalls {
    /// Applications whose packages an interrupted session has brought whole. They are not sent
    /// again: the device installs them as soon as the session begins.
    std::set<std::string> arrived;
    /// Applications whose coordinators lead nowhere any more: to be cancelled before the session.
    std::vector<std::string> obsolete;
};

/// By what the installs are judged that an earlier session has begun.
struct StandingRules {
    using Version = std::function<std::optional<std::string>(const std::string& identifier)>;
    /// Device policy allows no install at all.
    bool isForbidden = false;
    /// What the plan does not name is none of the session's business: it goes on.
    bool leavesOthers = false;
    /// The version of the package that has arrived for an application; nothing when there is none
    /// that can be read. Never null.
    Version arrivedVersion = [](const std::string&) { return std::nullopt; };
    /// The version that the library holds of an application; nothing when it holds none.
    Version libraryVersion = nullptr;
};

/// The version that the package says which waits on the device for an application; nothing when
/// there is none that can be read.
[[nodiscard]] std::optional<std::string> versionOfArrived(Device& device,
                                                          const std::string& identifier);

/// Why an application is left to another client.
[[nodiscard]] std::string heldSentence(const std::string& identifier, CoordinationClient client);

/// Holds the plan against the coordinators that stand. Marks in it what has arrived, adds what the
/// device installs though the plan has not asked for it, and skips what another client has in hand.
/// `present` is everything that the device holds.
///
/// A coordinator of the sync client goes on where the plan still asks for the same version of the
/// same application, unless that is to be removed, or the rules are against it. Everything else of
/// the sync client's is obsolete: after the session the device holds what the plan says, whatever
/// had arrived before. A restore is not the plan's to judge: where the store has delivered the
/// package, the device installs it, and where a crash has left no placeholder, it is in the way of
/// what the plan asks for.
[[nodiscard]] StandingInstalls takeUp(SyncPlan& plan,
                                      const std::vector<CoordinatorRecord>& coordinators,
                                      const std::vector<ApplicationRecord>& present,
                                      const StandingRules& rules);

/// Cancels what is obsolete. One that has gone meanwhile is no failure.
Status cancelObsolete(Device& device, const StandingInstalls& standing);

}  // namespace appsync
