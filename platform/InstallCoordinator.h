#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/InstallPlaceholder.h"
#include "platform/InstallPromises.h"
#include "platform/Result.h"

namespace appsync {

class InstallCoordinator;
using InstallCoordinatorPointer = std::shared_ptr<InstallCoordinator>;

/// How the application of a coordinator is to be installed.
struct InstallOptions {
    StoreMetadata storeMetadata;
    /// An `InstallType`.
    std::uint64_t installType = 0;
    /// A number of the platform's.
    std::uint64_t installTargetType = 0;

    friend bool operator==(const InstallOptions&, const InstallOptions&) = default;
};

/// Hears of coordinators, on threads of the service's, several at once. A coordinator is only lent
/// for the call; whoever wants more of it keeps the pointer.
class InstallCoordinatorObserver {
  public:
    virtual ~InstallCoordinatorObserver() = default;

    /// `promiseDidBeginFulfillmentWithIdentifier:`
    virtual void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) = 0;
    /// `coordinatorDidInstallPlaceholder:`: the placeholder stands on the home screen, or could not
    /// be put there: then the coordinator carries the error.
    virtual void coordinatorDidInstallPlaceholder(
        const std::shared_ptr<InstallCoordinator>& coordinator) = 0;
    /// `coordinatorDidCompleteSuccessfully:`: the install has ended. It failed when the coordinator
    /// carries an error.
    virtual void coordinatorDidCompleteSuccessfully(
        const std::shared_ptr<InstallCoordinator>& coordinator) = 0;
    /// `coordinator:canceledWithReason:client:`: a client has cancelled it, or the service itself.
    virtual void coordinatorCanceledWithReason(
        const std::shared_ptr<InstallCoordinator>& coordinator, const ErrorRecord& reason,
        CoordinationClient client) = 0;
    /// `coordinatorShouldPrioritize:`: somebody wants this application before the others.
    virtual void coordinatorShouldPrioritize(
        const std::shared_ptr<InstallCoordinator>& coordinator) = 0;
};

/// One application's install, as the service coordinates it: a set of pieces, each of which may be
/// there or not. When the pieces that its kind needs are there and every promise is complete, the
/// service installs on threads of its own, and the coordinator is gone afterwards. An install that
/// fails takes the placeholder away and leaves an installed version as it is; of an application
/// that is being restored the placeholder stays, and a coordinator that waits for another package.
///
/// An object is a handle on the service's record, which outlives it, and on a device the process
/// too. Callable on any thread. Nothing throws. Each piece is to be asked for before it is set: a
/// second set is refused with an error, and the first stands. On a coordinator that is done or
/// cancelled every set is refused and every question is answered as when it ended.
class InstallCoordinator {
  public:
    virtual ~InstallCoordinator() = default;

    /// Nothing for a coordinator of which the service no longer knows whose it was.
    [[nodiscard]] virtual std::optional<std::string> bundleIdentifier() const = 0;
    /// The client that created it.
    [[nodiscard]] virtual CoordinationClient creatorIdentifier() const = 0;
    /// Why it failed or was cancelled; nothing while it goes on and after a success.
    [[nodiscard]] virtual std::optional<ErrorRecord> error() const = 0;
    /// How it appears in messages.
    [[nodiscard]] virtual std::string description() const = 0;

    /// Who hears of this coordinator, held weakly; kept alive while it is being called. One at a
    /// time: a later one takes the place of the earlier. It also hears of what happens to the
    /// record through other handles.
    virtual void setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) = 0;

    [[nodiscard]] virtual bool hasInstallOptions() const = 0;
    virtual Status setInstallOptions(const InstallOptions& options) = 0;

    /// Assets that the application wants with its first start.
    [[nodiscard]] virtual bool hasInitialODRAssetPromises() const = 0;
    virtual Status setInitialODRAssetPromises(
        const std::vector<std::shared_ptr<PathTransferPromise>>& promises) = 0;

    /// The package. Null when there is none.
    [[nodiscard]] virtual std::shared_ptr<PathTransferPromise> appAssetPromise() const = 0;
    virtual Status setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise) = 0;
    /// Whose task the package is where nobody has promised it; nothing when that is not said.
    [[nodiscard]] virtual std::optional<CoordinationClient> appAssetPromiseResponsibleClient()
        const = 0;
    virtual Status setAppAssetPromiseResponsibleClient(CoordinationClient client) = 0;

    [[nodiscard]] virtual bool hasUserDataPromise() const = 0;
    virtual Status setUserDataPromise(const std::shared_ptr<OutOfBandPromise>& promise) = 0;

    [[nodiscard]] virtual bool hasPlaceholderPromise() const = 0;
    /// Refuses null, and the placeholder of another application.
    virtual Status setPlaceholderPromise(
        const std::shared_ptr<InstallPlaceholder>& placeholder) = 0;

    /// Ends it: its placeholder goes, its promises are given up, an installed version stays. Its
    /// observer hears. A second cancel does nothing.
    virtual void cancelForReason(const ErrorRecord& reason, CoordinationClient client) = 0;
};

}  // namespace appsync
