#include "host/session/SyncOutcome.h"

#include <algorithm>
#include <chrono>
#include <future>
#include <map>
#include <set>
#include <system_error>
#include <thread>
#include <utility>

#include "device/Device.h"
#include "host/console/Problem.h"
#include "host/plan/StandingInstalls.h"
#include "host/plan/SyncPlan.h"
#include "host/session/Interruption.h"
#include "host/session/Session.h"
#include "host/watch/SessionFacts.h"

namespace appsync {
namespace {

bool hasUnmet(const std::vector<PlannedSkip>& skipped) {
    return std::any_of(skipped.begin(), skipped.end(),
                       [](const PlannedSkip& skip) { return skip.isUnmet; });
}

// Of a device that a process looks at before it leaves at once.
constexpr std::chrono::milliseconds kLongestCommit{500};
constexpr std::chrono::milliseconds kLongestLook{1000};

std::string interruption() { return "interrupted: " + std::string(kRunAgain); }

class Summarizer {
  public:
    Summarizer(const SyncPlan& plan, const SessionFacts& facts, const SessionAftermath& aftermath)
        : plan_(plan), facts_(facts), aftermath_(aftermath) {
        for (const ApplicationRecord& record : aftermath.present) {
            present_.insert(record.identifier);
            if (!record.isPlaceholder) versions_[record.identifier] = record.version.value_or("");
        }
        for (const PlannedInstall& each : plan.install) installs_.insert(each.identifier);
        for (const PlannedInstall& each : plan.update) installs_.insert(each.identifier);
    }

    SyncSummary make() {
        summary_.requested = facts_.requests();
        summary_.bytes = facts_.bytesSent();
        summary_.failed = plan_.failed;
        summary_.skipped = plan_.skipped;
        summary_.bringsInStep = plan_.bringsInStep;
        for (const std::string& identifier : plan_.remove) judgeRemoval(identifier);
        for (const PlannedInstall& each : plan_.install) judge(each, summary_.installed);
        for (const PlannedInstall& each : plan_.update) judge(each, summary_.updated);
        judgeUnplanned();
        addUnplannedInstalls();
        if (isCutOffUnnoticed()) addSessionFailure(interruption());
        if (aftermath_.failure) addSessionFailure(*aftermath_.failure);
        summary_.incomplete = !summary_.failed.empty() || hasUnmet(summary_.skipped);
        return std::move(summary_);
    }

  private:
    void judge(const PlannedInstall& planned, std::vector<std::string>& done) {
        const auto found = versions_.find(planned.identifier);
        const bool isThere =
            found != versions_.end() && (facts_.wasInstalled(planned.identifier) ||
                                         hasComeUnseen(found->second != planned.oldVersion));
        if (isThere && (planned.newVersion.empty() || found->second == planned.newVersion)) {
            done.push_back(planned.identifier);
        } else if (isThere) {
            fail(planned.identifier, "version " + found->second + " was installed instead of " +
                                         planned.newVersion +
                                         ": the package has changed meanwhile");
        } else if (facts_.wasInstalled(planned.identifier)) {
            fail(planned.identifier,
                 "it was installed, and uninstalled on the device meanwhile: sync again to bring "
                 "it back");
        } else {
            undone(planned.identifier, aftermath_.installationAllowed, kInstallationForbidden,
                   "the device did not ask for its package: appsync log tells why");
        }
    }

    // What is not named in a plan, such as the icon layout, may not have reached the device.
    [[nodiscard]] bool isCutOffUnnoticed() const {
        return aftermath_.isInterrupted && summary_.failed.empty() && !facts_.wasReconciled();
    }

    // An interrupted session does not hear how everything ends that has begun; the device tells.
    [[nodiscard]] bool hasComeUnseen(bool isChanged) const {
        return aftermath_.isInterrupted && isChanged;
    }

    void judgeRemoval(const std::string& identifier) {
        const bool isPresent = present_.contains(identifier);
        const bool isGone = facts_.wasRemoved(identifier)
                                ? !isPresent || installs_.contains(identifier)
                                : hasComeUnseen(!isPresent);
        if (isGone) {
            summary_.removed.push_back(identifier);
        } else if (!present_.contains(identifier)) {
            summary_.skipped.push_back(
                {identifier, "it was uninstalled on the device meanwhile", false});
        } else {
            undone(identifier, aftermath_.removalAllowed, kRemovalForbidden,
                   "it is still there: sync again, or see appsync log");
        }
    }

    // What failed without having been in the plan: an entry that the host could make nothing of.
    void judgeUnplanned() {
        std::set<std::string> named;
        for (const SyncFailure& each : summary_.failed) named.insert(each.identifier);
        for (const std::string& identifier : summary_.requested) {
            // Without an identifier, the plan has named the entry by its number.
            if (identifier.empty() || installs_.contains(identifier)) continue;
            if (!named.insert(identifier).second) continue;
            if (const auto cause = facts_.firstFailure(identifier)) fail(identifier, *cause);
        }
    }

    // What an earlier session had brought, and the plan did not know of.
    void addUnplannedInstalls() {
        for (const std::string& identifier : facts_.installedIdentifiers()) {
            const bool isThere = versions_.contains(identifier) && !installs_.contains(identifier);
            if (isThere) summary_.installed.push_back(identifier);
        }
    }

    void undone(const std::string& identifier, bool isAllowed, std::string_view whyForbidden,
                const std::string& whyElse) {
        if (const auto cause = facts_.firstFailure(identifier)) return fail(identifier, *cause);
        if (aftermath_.failure) return fail(identifier, *aftermath_.failure);
        if (const auto client = facts_.holder(identifier)) {
            summary_.skipped.push_back({identifier, heldSentence(identifier, *client), true});
            return;
        }
        if (!isAllowed) {
            summary_.skipped.push_back({identifier, std::string(whyForbidden), true});
            return;
        }
        fail(identifier, aftermath_.isInterrupted ? interruption() : whyElse);
    }

    void fail(const std::string& identifier, const std::string& error) {
        summary_.failed.push_back({identifier, error});
    }

    void addSessionFailure(const std::string& error) { fail("session", error); }

    const SyncPlan& plan_;
    const SessionFacts& facts_;
    const SessionAftermath& aftermath_;
    std::set<std::string> present_;
    std::map<std::string, std::string> versions_;
    std::set<std::string> installs_;
    SyncSummary summary_;
};

SessionAftermath policyOf(const SessionFacts& facts) {
    SessionAftermath aftermath;
    aftermath.installationAllowed = !facts.wasForbidden(PolicyFeature::AppInstallationAllowed);
    aftermath.removalAllowed = !facts.wasForbidden(PolicyFeature::AppRemovalAllowed);
    return aftermath;
}

// What the device holds if everything stands that was seen to be installed.
SessionAftermath assumedAftermath(const SyncPlan& plan, const SessionFacts& facts) {
    SessionAftermath aftermath = policyOf(facts);
    for (const std::string& identifier : plan.remove) {
        if (facts.wasRemoved(identifier)) continue;
        ApplicationRecord record;
        record.identifier = identifier;
        record.isPlaceholder = true;  // something of it
        aftermath.present.push_back(std::move(record));
    }
    for (const auto* installs : {&plan.install, &plan.update}) {
        for (const PlannedInstall& each : *installs) {
            if (!facts.wasInstalled(each.identifier)) continue;
            ApplicationRecord record;
            record.identifier = each.identifier;
            record.version = each.newVersion;
            aftermath.present.push_back(std::move(record));
        }
    }
    return aftermath;
}

}  // namespace

Result<SessionAftermath> aftermathOf(Device& device, const SessionEnd& end,
                                     const SessionFacts& facts) {
    Result<std::vector<ApplicationRecord>> present = device.applications();
    if (!present) return unusable(present.error());
    SessionAftermath aftermath = policyOf(facts);
    aftermath.present = *std::move(present);
    aftermath.isInterrupted = end.isInterrupted;
    std::optional<ErrorRecord> failure = device.databaseFailure();
    if (!failure) failure = end.error;
    if (failure) aftermath.failure = failure->description();
    return aftermath;
}

Result<SessionAftermath> aftermathOnLeaving(Device& device, const SessionFacts& facts) {
    using Look = Result<std::vector<ApplicationRecord>>;
    const auto noAnswer = [] { return failure("the device does not answer", "look at it later"); };
    std::promise<Look> promise;
    std::future<Look> future = promise.get_future();
    try {
        std::thread([&device, noAnswer, kept = std::move(promise)]() mutable {
            kept.set_value(device.freeze(kLongestCommit) ? device.applications()
                                                         : Look(noAnswer()));
        }).detach();
    } catch (const std::system_error&) {
        return noAnswer();
    }
    if (future.wait_for(kLongestLook) != std::future_status::ready) return noAnswer();
    Look present = future.get();
    if (!present) return present.error();
    SessionAftermath aftermath = policyOf(facts);
    aftermath.present = *std::move(present);
    aftermath.isInterrupted = true;
    return aftermath;
}

SyncSummary summarize(const SyncPlan& plan, const SessionFacts& facts,
                      const SessionAftermath& aftermath) {
    return Summarizer(plan, facts, aftermath).make();
}

SyncSummary summarizeInterrupted(const SyncPlan& plan, const SessionFacts& facts) {
    SessionAftermath aftermath = assumedAftermath(plan, facts);
    aftermath.isInterrupted = true;
    return summarize(plan, facts, aftermath);
}

bool tellsOfInterruption(const SyncSummary& summary) {
    return std::any_of(summary.failed.begin(), summary.failed.end(), [](const SyncFailure& each) {
        return each.error.starts_with(interruption());
    });
}

SyncSummary summarizeRefused(const SyncPlan& allowed, const std::string& reason) {
    SyncSummary summary;
    summary.failed = allowed.failed;
    summary.skipped = allowed.skipped;
    for (const auto* installs : {&allowed.install, &allowed.update}) {
        for (const PlannedInstall& each : *installs) {
            summary.failed.push_back({each.identifier, reason});
        }
    }
    for (const std::string& identifier : allowed.remove) {
        summary.failed.push_back({identifier, reason});
    }
    summary.incomplete = !summary.failed.empty() || hasUnmet(summary.skipped);
    return summary;
}

SyncSummary summarizeFailed(const SyncPlan& plan, const SessionFacts& facts,
                            const ErrorRecord& error) {
    SessionAftermath aftermath = assumedAftermath(plan, facts);
    aftermath.failure = error.description();
    return summarize(plan, facts, aftermath);
}

}  // namespace appsync
