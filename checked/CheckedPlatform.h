#pragma once

// checked: a wrapper around a platform that tells, while sessions run, which contract was broken.
// `CheckedPlatform` (this header) wraps each service: CheckedRegistry.h, CheckedCoordination.h (its
// handles: CheckedCoordinator.h, CheckedPromises.h; its observers: CoordinatorObservers.h),
// CheckedTransfers.h, CheckedFiles.h, CheckedQueues.h, CheckedServices.h; each tells a
// BreachBook.h. Includes platform/, contract/forwarding and the standard library only, so that a
// port links it into the daemon that it tries out. Called by whoever makes a client. What can be
// proven before there is a session, the contract kit proves (contract/ContractKit.h).

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>

#include "checked/ContractBreach.h"
#include "platform/Platform.h"

namespace appsync {

/// How a `CheckedPlatform` looks, and whom it tells.
struct CheckedPlatformOptions {
    /// Gets each breach, on the thread that saw it, one call at a time; the same one once only. It
    /// must not call the platform.
    std::function<void(const ContractBreach& breach)> sink;
    /// How long after it was asked for a call that must come counts as lost.
    std::chrono::nanoseconds patience = std::chrono::seconds(30);
    /// How long the registry may leave a question of another thread unanswered while it calls an
    /// observer and changes nothing, before it is taken to hold a lock.
    std::chrono::nanoseconds lockPatience = std::chrono::seconds(2);
    /// Tells threads apart; those of the process unless the platform has others.
    std::function<std::uintptr_t()> currentThread;
};

/// A platform that passes every call on to another one, and looks at what comes back:
///
/// - of the registry: each observer's first report comes in time, once, not on the thread that is
///   just adding it, not with a lock held, and none after it was removed; walks; records and
///   progress;
/// - of the coordination service: every completion comes, once; no call after an observer's end,
///   on a thread that is in a call of the service, or of an install that has ended with success; a
///   service that an observer calls answers it; look-ups; new promises and their progress; pieces
///   that are refused where they were taken, and taken where they are to be refused;
/// - of the transfer service: every completion comes, once;
/// - errors have a domain, one that is known where platform/Error.h has one for the service; those
///   of the files an errno value and a sentence;
/// - queues run tasks as they say; nothing is null that must be there.
///
/// Not looked at: icons, the transaction log, notifications; and how a package or a placeholder
/// gets from a coordinator into the registry.
///
/// A call costs a few comparisons more; a call of a registry's observer one look-up by another
/// thread of the platform's queues; a piece that a coordinator is given two questions to it; a call
/// of the coordination service by an observer a piece of delayed work. What was let go of is kept
/// until this object goes, a few hundred bytes for each observer of the registry: for a lab, not
/// for a product. Both platform and this object outlive the client.
class CheckedPlatform {
  public:
    CheckedPlatform(const Platform& platform, CheckedPlatformOptions options);
    ~CheckedPlatform();
    CheckedPlatform(const CheckedPlatform&) = delete;
    CheckedPlatform& operator=(const CheckedPlatform&) = delete;

    /// What a client is created with.
    [[nodiscard]] Platform services();

  private:
    struct Services;
    const std::unique_ptr<Services> services_;
};

}  // namespace appsync
