#include "checked/CheckedCoordination.h"

#include <atomic>

#include "checked/Overdue.h"

namespace appsync {

namespace {

/// Stands in the delegate's place at the service, also after the observer's end.
class Delegate final : public InstallCoordinatorObserver {
  public:
    Delegate(std::weak_ptr<InstallCoordinatorObserver> delegate, std::shared_ptr<BreachBook> book)
        : delegate_(std::move(delegate)), book_(std::move(book)) {}

    void end() { isOver_ = true; }

    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) override {
        if (const auto delegate = called())
            delegate->promiseDidBeginFulfillmentWithIdentifier(promise);
    }
    void coordinatorDidInstallPlaceholder(const InstallCoordinatorPointer& coordinator) override {
        if (const auto delegate = calledWith(coordinator))
            delegate->coordinatorDidInstallPlaceholder(coordinator);
    }
    void coordinatorDidCompleteSuccessfully(const InstallCoordinatorPointer& coordinator) override {
        if (const auto delegate = calledWith(coordinator))
            delegate->coordinatorDidCompleteSuccessfully(coordinator);
    }
    void coordinatorCanceledWithReason(const InstallCoordinatorPointer& coordinator,
                                       const ErrorRecord& reason,
                                       CoordinationClient client) override {
        if (const auto delegate = calledWith(coordinator))
            delegate->coordinatorCanceledWithReason(coordinator, reason, client);
    }
    void coordinatorShouldPrioritize(const InstallCoordinatorPointer& coordinator) override {
        if (const auto delegate = calledWith(coordinator))
            delegate->coordinatorShouldPrioritize(coordinator);
    }

  private:
    std::shared_ptr<InstallCoordinatorObserver> called() {
        if (!isOver_) return delegate_.lock();
        book_->broken("platform/InstallCoordinatorService.h",
                      "It ends with the object: no call begins after that.",
                      "a delegate was called after its observer's end");
        return nullptr;
    }
    std::shared_ptr<InstallCoordinatorObserver> calledWith(
        const InstallCoordinatorPointer& coordinator) {
        if (coordinator != nullptr) return called();
        book_->broken("platform/InstallCoordinator.h",
                      "A coordinator is only lent for the call; whoever wants more of it keeps the "
                      "pointer.",
                      "an observer was called with null in the place of a coordinator");
        return nullptr;
    }

    const std::weak_ptr<InstallCoordinatorObserver> delegate_;
    const std::shared_ptr<BreachBook> book_;
    std::atomic<bool> isOver_{false};
};

class CheckedInstallObserver final : public AppInstallObserver {
  public:
    CheckedInstallObserver(std::shared_ptr<AppInstallObserver> observer,
                           std::shared_ptr<Delegate> delegate)
        : observer_(std::move(observer)), delegate_(std::move(delegate)) {}
    ~CheckedInstallObserver() override {
        observer_.reset();
        delegate_->end();
    }
    CheckedInstallObserver(const CheckedInstallObserver&) = delete;
    CheckedInstallObserver& operator=(const CheckedInstallObserver&) = delete;

  private:
    std::shared_ptr<AppInstallObserver> observer_;
    const std::shared_ptr<Delegate> delegate_;
};

}  // namespace

InstallCoordinatorService::Coordinator CheckedCoordination::coordinator(
    CoordinatorKind kind, const std::string& identifier, CoordinationClient client,
    Creation creation) {
    Coordinator found = service_.coordinator(kind, identifier, client, creation);
    if (found.error) book_->checkDomain(*found.error, "the coordination service");
    if (found.coordinator != nullptr && creation == Creation::OnlyExisting && found.wasCreated) {
        book_->broken("platform/InstallCoordinatorService.h",
                      "No coordinator and no error when there is none and none was to be created.",
                      "a coordinator was created that was not asked for");
    }
    return found;
}

void CheckedCoordination::uninstallApp(const std::string& identifier,
                                       UninstallCompletion completion) {
    struct Call {
        std::atomic<int> completions{0};
        std::atomic<bool> hasReturned{false};
    };
    const auto call = std::make_shared<Call>();
    const std::uintptr_t thread = book_->currentThread();
    service_.uninstallApp(
        identifier,
        [call, thread, book = book_, completion = std::move(completion)](const ErrorRecord* error) {
            if (call->completions.fetch_add(1) != 0) {
                book->broken("platform/InstallCoordinatorService.h",
                             "Returns at once; the completion is called exactly once.",
                             "the completion was called again");
                return;
            }
            if (!call->hasReturned && book->currentThread() == thread) {
                book->broken("platform/InstallCoordinatorService.h",
                             "Called on a thread of the service's; `error` is null on success.",
                             "the completion was called on the thread that was in uninstallApp");
            }
            if (error != nullptr) book->checkDomain(*error, "uninstallApp");
            completion(error);
        });
    call->hasReturned = true;
    reportIfOverdue(
        queues_, patience_ / kWaits, [call] { return call->completions == 0; },
        [book = book_] {
            book->broken("platform/InstallCoordinatorService.h",
                         "Returns at once; the completion is called exactly once.",
                         "the completion was not called in time");
        });
}

std::shared_ptr<AppInstallObserver> CheckedCoordination::makeAppInstallObserver(
    const std::string& serviceName, const std::set<CoordinationClient>& clients,
    std::weak_ptr<InstallCoordinatorObserver> delegate) {
    auto checked = std::make_shared<Delegate>(std::move(delegate), book_);
    auto observer = service_.makeAppInstallObserver(serviceName, clients, checked);
    if (observer == nullptr) return nullptr;
    return std::make_shared<CheckedInstallObserver>(std::move(observer), std::move(checked));
}

}  // namespace appsync
