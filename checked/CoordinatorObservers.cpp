#include "checked/CoordinatorObservers.h"

#include <algorithm>

#include "checked/CheckedCoordinator.h"

namespace appsync {

namespace {

/// The observer of one coordinator: what has ended with success has ended.
class ObserverOfOne final : public CheckedCoordinatorObserver {
  public:
    using CheckedCoordinatorObserver::CheckedCoordinatorObserver;

  private:
    void willHear(News news, const InstallCoordinator& coordinator) override {
        if (news == News::Priority) return;
        const bool isDone = news == News::Completion && !coordinator.error();
        const bool wasDone = isDone ? hasSucceeded_.exchange(true) : hasSucceeded_.load();
        if (!wasDone) return;
        watch().book().broken(
            "platform/InstallCoordinator.h",
            "`coordinatorDidCompleteSuccessfully:`: the install has ended.",
            std::string(nameOf(news)) + " was told of an install that had ended with success");
    }
    static const char* nameOf(News news) {
        if (news == News::Placeholder) return "a placeholder";
        return news == News::Completion ? "another completion" : "a cancel";
    }

    std::atomic<bool> hasSucceeded_{false};
};

}  // namespace

CheckedCoordinatorObserver::CheckedCoordinatorObserver(
    std::weak_ptr<InstallCoordinatorObserver> observer,
    const std::shared_ptr<CoordinatorObservers>& observers)
    : ForwardingCoordinatorObserver(std::move(observer)),
      watch_(observers->watch()),
      observers_(observers) {}

void CheckedCoordinatorObserver::hear(News news, const CoordinatorPointer& coordinator,
                                      const std::function<void(const CoordinatorPointer&)>& pass) {
    if (!mayBeCalled()) return;
    const CoordinationWatch::Report report(watch());
    if (coordinator == nullptr) {
        watch().book().broken("platform/InstallCoordinator.h",
                              "A coordinator is only lent for the call; whoever wants more of it "
                              "keeps the pointer.",
                              "an observer was called with null in the place of a coordinator");
        return;
    }
    willHear(news, *coordinator);
    const auto observers = observers_.lock();
    pass(observers != nullptr ? observers->checked(coordinator) : coordinator);
}

void CheckedCoordinatorObserver::promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) {
    if (!mayBeCalled()) return;
    const CoordinationWatch::Report report(watch());
    ForwardingCoordinatorObserver::promiseDidBeginFulfillmentWithIdentifier(promise);
}

void CheckedCoordinatorObserver::coordinatorDidInstallPlaceholder(
    const CoordinatorPointer& coordinator) {
    hear(News::Placeholder, coordinator, [this](const CoordinatorPointer& checked) {
        ForwardingCoordinatorObserver::coordinatorDidInstallPlaceholder(checked);
    });
}

void CheckedCoordinatorObserver::coordinatorDidCompleteSuccessfully(
    const CoordinatorPointer& coordinator) {
    hear(News::Completion, coordinator, [this](const CoordinatorPointer& checked) {
        ForwardingCoordinatorObserver::coordinatorDidCompleteSuccessfully(checked);
    });
}

void CheckedCoordinatorObserver::coordinatorCanceledWithReason(
    const CoordinatorPointer& coordinator, const ErrorRecord& reason, CoordinationClient client) {
    hear(News::Cancel, coordinator, [&](const CoordinatorPointer& checked) {
        ForwardingCoordinatorObserver::coordinatorCanceledWithReason(checked, reason, client);
    });
}

void CheckedCoordinatorObserver::coordinatorShouldPrioritize(
    const CoordinatorPointer& coordinator) {
    hear(News::Priority, coordinator, [this](const CoordinatorPointer& checked) {
        ForwardingCoordinatorObserver::coordinatorShouldPrioritize(checked);
    });
}

bool CheckedDelegate::mayBeCalled() {
    if (!isOver_) return true;
    watch().book().broken("platform/InstallCoordinatorService.h",
                          "It ends with the object: no call begins after that.",
                          "a delegate was called after its observer's end");
    return false;
}

std::weak_ptr<InstallCoordinatorObserver> CoordinatorObservers::ofOneCoordinator(
    const std::weak_ptr<InstallCoordinatorObserver>& observer) {
    if (observer.expired()) return {};
    auto checked = std::make_shared<ObserverOfOne>(observer, shared_from_this());
    const std::lock_guard guard(mutex_);
    if (held_.size() >= 2 * heldAfterLast_) letGoOfExpired();
    held_.push_back(checked);
    return checked;
}

std::shared_ptr<CheckedDelegate> CoordinatorObservers::delegate(
    const std::weak_ptr<InstallCoordinatorObserver>& delegate) {
    {
        // Where one was let go of, its coordinators are the delegate's to hear of.
        const std::lock_guard guard(mutex_);
        letGoOfExpired();
    }
    return std::make_shared<CheckedDelegate>(delegate, shared_from_this());
}

std::shared_ptr<InstallCoordinator> CoordinatorObservers::checked(
    std::shared_ptr<InstallCoordinator> coordinator) {
    if (coordinator == nullptr) return nullptr;
    return std::make_shared<CheckedCoordinator>(std::move(coordinator), shared_from_this());
}

void CoordinatorObservers::letGoOfExpired() {
    std::erase_if(held_, [](const auto& each) { return each->isExpired(); });
    heldAfterLast_ = held_.size();
}

}  // namespace appsync
