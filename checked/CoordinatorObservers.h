#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <utility>
#include <vector>

#include "checked/CoordinationWatch.h"
#include "contract/forwarding/ForwardingCoordination.h"

namespace appsync {

class CoordinatorObservers;

/// Stands in an observer's place at the service, and looks at how it is called.
class CheckedCoordinatorObserver : public ForwardingCoordinatorObserver {
  public:
    CheckedCoordinatorObserver(std::weak_ptr<InstallCoordinatorObserver> observer,
                               const std::shared_ptr<CoordinatorObservers>& observers);

    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) override;
    void coordinatorDidInstallPlaceholder(
        const std::shared_ptr<InstallCoordinator>& coordinator) override;
    void coordinatorDidCompleteSuccessfully(
        const std::shared_ptr<InstallCoordinator>& coordinator) override;
    void coordinatorCanceledWithReason(const std::shared_ptr<InstallCoordinator>& coordinator,
                                       const ErrorRecord& reason,
                                       CoordinationClient client) override;
    void coordinatorShouldPrioritize(
        const std::shared_ptr<InstallCoordinator>& coordinator) override;

  protected:
    /// What an observer hears of a coordinator.
    enum class News { Placeholder, Completion, Cancel, Priority };

    [[nodiscard]] CoordinationWatch& watch() const { return *watch_; }

  private:
    using CoordinatorPointer = std::shared_ptr<InstallCoordinator>;

    /// Whether it may be called at all now.
    [[nodiscard]] virtual bool mayBeCalled() { return true; }
    virtual void willHear(News /*news*/, const InstallCoordinator& /*coordinator*/) {}
    /// Calls `pass` with the coordinator, checked, where nothing is wrong with the call.
    void hear(News news, const CoordinatorPointer& coordinator,
              const std::function<void(const CoordinatorPointer&)>& pass);

    const std::shared_ptr<CoordinationWatch> watch_;
    const std::weak_ptr<CoordinatorObservers> observers_;  // which may hold this
};

/// A delegate for all coordinators of some clients, until it is ended.
class CheckedDelegate final : public CheckedCoordinatorObserver {
  public:
    using CheckedCoordinatorObserver::CheckedCoordinatorObserver;

    void end() { isOver_ = true; }

  private:
    [[nodiscard]] bool mayBeCalled() override;

    std::atomic<bool> isOver_{false};
};

/// The observers that stand in the place of others at one service. It holds those of single
/// coordinators for as long as the others live, as the service would not.
class CoordinatorObservers : public std::enable_shared_from_this<CoordinatorObservers> {
  public:
    explicit CoordinatorObservers(std::shared_ptr<CoordinationWatch> watch)
        : watch_(std::move(watch)) {}

    [[nodiscard]] const std::shared_ptr<CoordinationWatch>& watch() const { return watch_; }

    /// One that is held here; none where there is no observer.
    [[nodiscard]] std::weak_ptr<InstallCoordinatorObserver> ofOneCoordinator(
        const std::weak_ptr<InstallCoordinatorObserver>& observer);
    [[nodiscard]] std::shared_ptr<CheckedDelegate> delegate(
        const std::weak_ptr<InstallCoordinatorObserver>& delegate);
    /// The coordinator, looked at.
    [[nodiscard]] std::shared_ptr<InstallCoordinator> checked(
        std::shared_ptr<InstallCoordinator> coordinator);

  private:
    void letGoOfExpired();

    const std::shared_ptr<CoordinationWatch> watch_;
    std::mutex mutex_;
    // Protected by mutex_.
    std::vector<std::shared_ptr<CheckedCoordinatorObserver>> held_;
    std::size_t heldAfterLast_ = 0;
};

}  // namespace appsync
