#pragma once

#include <optional>
#include <string>
#include <vector>

#include "device/values/DeviceRecords.h"
#include "host/watch/SyncEvents.h"
#include "platform/Result.h"

namespace appsync {

class Device;
class SessionFacts;
struct SessionEnd;
struct SyncPlan;

/// What is known when a session is over.
struct SessionAftermath {
    /// Everything that the device holds now.
    std::vector<ApplicationRecord> present;
    /// What the plug-in was told when it decided; policy may have changed since.
    bool installationAllowed = true;
    bool removalAllowed = true;
    bool isInterrupted = false;
    /// Why the session as a whole failed, if it did.
    std::optional<std::string> failure;
};

/// Asks the device what is known.
[[nodiscard]] Result<SessionAftermath> aftermathOf(Device& device, const SessionEnd& end,
                                                   const SessionFacts& facts);

/// The same for a process that leaves the session in its middle, and then leaves the device alone:
/// it is kept from changing any more, so that what is said is what is found later. Takes a second
/// at most; an error when the device has not answered by then. For the thread that ends the
/// process.
[[nodiscard]] Result<SessionAftermath> aftermathOnLeaving(Device& device,
                                                          const SessionFacts& facts);

/// Holds the plan against what the device holds after the session: what was asked for and did not
/// happen is failed, with its first cause, or skipped where policy forbids it. The time is
/// the caller's to fill in.
[[nodiscard]] SyncSummary summarize(const SyncPlan& plan, const SessionFacts& facts,
                                    const SessionAftermath& aftermath);

// The same without a look at the device, from what was seen in the session alone.

/// It is left in its middle, or before it began.
[[nodiscard]] SyncSummary summarizeInterrupted(const SyncPlan& plan, const SessionFacts& facts);
/// Whether one of its failures says already that the session was interrupted.
[[nodiscard]] bool tellsOfInterruption(const SyncSummary& summary);
/// Nothing of what policy would allow is done, for one reason.
[[nodiscard]] SyncSummary summarizeRefused(const SyncPlan& allowed, const std::string& reason);
/// The device cannot be looked at any more.
[[nodiscard]] SyncSummary summarizeFailed(const SyncPlan& plan, const SessionFacts& facts,
                                          const ErrorRecord& error);

}  // namespace appsync
