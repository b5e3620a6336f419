#include "host/watch/WatchedCoordination.h"

#include <map>
#include <utility>

#include "host/watch/SessionWatch.h"
#include "platform/InstallCoordinator.h"

namespace appsync {

bool CallGate::enter() {
    const std::lock_guard guard(mutex_);
    if (!isClosed_) ++inside_;
    return !isClosed_;
}

void CallGate::leave() {
    {
        const std::lock_guard guard(mutex_);
        --inside_;
    }
    left_.notify_all();
}

void CallGate::close() {
    std::unique_lock lock(mutex_);
    isClosed_ = true;
    left_.wait(lock, [this] { return inside_ == 0; });
}

namespace {

using CoordinatorPointer = std::shared_ptr<InstallCoordinator>;

// Stands in the gate for the time of one call.
class Passage {
  public:
    explicit Passage(CallGate& gate) : gate_(gate), isOpen_(gate.enter()) {}
    Passage(const Passage&) = delete;
    Passage& operator=(const Passage&) = delete;
    ~Passage() {
        if (isOpen_) gate_.leave();
    }
    [[nodiscard]] bool isOpen() const { return isOpen_; }

  private:
    CallGate& gate_;
    const bool isOpen_;
};

std::string identifierOf(const CoordinatorPointer& coordinator) {
    return coordinator->bundleIdentifier().value_or("");
}

class WatchedObserver : public InstallCoordinatorObserver {
  public:
    WatchedObserver(std::weak_ptr<InstallCoordinatorObserver> plugIn, SessionWatch& watch,
                    std::shared_ptr<CallGate> gate)
        : plugIn_(std::move(plugIn)), watch_(watch), gate_(std::move(gate)) {}

    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) override {
        handOn([](SessionWatch&) {},
               [&](auto& plugIn) { plugIn.promiseDidBeginFulfillmentWithIdentifier(promise); });
    }
    void coordinatorDidInstallPlaceholder(const CoordinatorPointer& coordinator) override {
        handOn(
            [&](SessionWatch& watch) {
                const auto error = coordinator->error();
                if (error) watch.placeholderRefused(identifierOf(coordinator), *error);
            },
            [&](auto& plugIn) { plugIn.coordinatorDidInstallPlaceholder(coordinator); });
    }
    void coordinatorDidCompleteSuccessfully(const CoordinatorPointer& coordinator) override {
        handOn(
            [&](SessionWatch& watch) {
                const auto error = coordinator->error();
                watch.installEnded(identifierOf(coordinator), error ? Status(*error) : Status());
            },
            [&](auto& plugIn) { plugIn.coordinatorDidCompleteSuccessfully(coordinator); });
    }
    void coordinatorCanceledWithReason(const CoordinatorPointer& coordinator,
                                       const ErrorRecord& reason,
                                       CoordinationClient client) override {
        handOn(
            [&](SessionWatch& watch) {
                watch.installCancelled(identifierOf(coordinator), reason, client);
            },
            [&](auto& plugIn) {
                plugIn.coordinatorCanceledWithReason(coordinator, reason, client);
            });
    }
    void coordinatorShouldPrioritize(const CoordinatorPointer& coordinator) override {
        handOn([](SessionWatch&) {},
               [&](auto& plugIn) { plugIn.coordinatorShouldPrioritize(coordinator); });
    }

  private:
    template <typename Tell, typename Call>
    void handOn(Tell tell, Call call) {
        const Passage passage(*gate_);
        if (!passage.isOpen()) return;
        tell(watch_);
        const std::shared_ptr<InstallCoordinatorObserver> plugIn = plugIn_.lock();
        if (plugIn != nullptr) call(*plugIn);
    }

    const std::weak_ptr<InstallCoordinatorObserver> plugIn_;
    SessionWatch& watch_;
    const std::shared_ptr<CallGate> gate_;
};

// Hands everything on; only the observer becomes the watched one.
class WatchedCoordinator : public InstallCoordinator {
  public:
    using ObserverFor = std::function<std::weak_ptr<InstallCoordinatorObserver>(
        std::weak_ptr<InstallCoordinatorObserver>)>;

    WatchedCoordinator(CoordinatorPointer coordinator, ObserverFor observerFor)
        : coordinator_(std::move(coordinator)), observerFor_(std::move(observerFor)) {}

    std::optional<std::string> bundleIdentifier() const override {
        return coordinator_->bundleIdentifier();
    }
    CoordinationClient creatorIdentifier() const override {
        return coordinator_->creatorIdentifier();
    }
    std::optional<ErrorRecord> error() const override { return coordinator_->error(); }
    std::string description() const override { return coordinator_->description(); }
    void setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) override {
        coordinator_->setObserver(observerFor_(std::move(observer)));
    }
    bool hasInstallOptions() const override { return coordinator_->hasInstallOptions(); }
    Status setInstallOptions(const InstallOptions& options) override {
        return coordinator_->setInstallOptions(options);
    }
    bool hasInitialODRAssetPromises() const override {
        return coordinator_->hasInitialODRAssetPromises();
    }
    Status setInitialODRAssetPromises(
        const std::vector<std::shared_ptr<PathTransferPromise>>& promises) override {
        return coordinator_->setInitialODRAssetPromises(promises);
    }
    std::shared_ptr<PathTransferPromise> appAssetPromise() const override {
        return coordinator_->appAssetPromise();
    }
    Status setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise) override {
        return coordinator_->setAppAssetPromise(promise);
    }
    std::optional<CoordinationClient> appAssetPromiseResponsibleClient() const override {
        return coordinator_->appAssetPromiseResponsibleClient();
    }
    Status setAppAssetPromiseResponsibleClient(CoordinationClient client) override {
        return coordinator_->setAppAssetPromiseResponsibleClient(client);
    }
    bool hasUserDataPromise() const override { return coordinator_->hasUserDataPromise(); }
    Status setUserDataPromise(const std::shared_ptr<OutOfBandPromise>& promise) override {
        return coordinator_->setUserDataPromise(promise);
    }
    bool hasPlaceholderPromise() const override { return coordinator_->hasPlaceholderPromise(); }
    Status setPlaceholderPromise(const std::shared_ptr<InstallPlaceholder>& placeholder) override {
        return coordinator_->setPlaceholderPromise(placeholder);
    }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        coordinator_->cancelForReason(reason, client);
    }

  private:
    const CoordinatorPointer coordinator_;
    const ObserverFor observerFor_;
};

class WatchedCoordination : public InstallCoordinatorService {
  public:
    WatchedCoordination(InstallCoordinatorService& service, SessionWatch& watch,
                        std::shared_ptr<CallGate> gate)
        : service_(service), watch_(watch), gate_(std::move(gate)) {}

    bool isCoordinationEnabled() override {
        const bool isEnabled = service_.isCoordinationEnabled();
        watch_.setCoordinated(isEnabled);
        return isEnabled;
    }
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation creation) override {
        if (creation == Creation::CreateIfNotExisting) watch_.placeholderAsked();
        Coordinator found = service_.coordinator(kind, identifier, client, creation);
        if (creation == Creation::CreateIfNotExisting) tell(found, identifier, client);
        found.coordinator = watched(std::move(found.coordinator));
        return found;
    }
    CoordinatorPointer existingCoordinator(const std::string& identifier,
                                           CoordinationClient client) override {
        return watched(service_.existingCoordinator(identifier, client));
    }
    std::shared_ptr<PathTransferPromise> makePathTransferPromise(
        const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
        std::uint64_t diskSpaceNeeded) override {
        return service_.makePathTransferPromise(name, client, path, diskSpaceNeeded);
    }
    std::shared_ptr<OutOfBandPromise> makeOutOfBandPromise(const std::string& name,
                                                           CoordinationClient client,
                                                           std::uint64_t diskSpaceNeeded) override {
        return service_.makeOutOfBandPromise(name, client, diskSpaceNeeded);
    }
    std::shared_ptr<InstallPlaceholder> makeAppPlaceholder(const std::string& name,
                                                           const std::string& identifier,
                                                           std::uint64_t installType,
                                                           CoordinationClient client) override {
        return service_.makeAppPlaceholder(name, identifier, installType, client);
    }
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override {
        watch_.uninstallBegins();
        service_.uninstallApp(identifier,
                              [gate = gate_, &watch = watch_, identifier,
                               completion = std::move(completion)](const ErrorRecord* error) {
                                  const Passage passage(*gate);
                                  if (!passage.isOpen()) return;
                                  if (completion) completion(error);
                                  watch.coordinatedUninstallEnded(
                                      identifier, error != nullptr ? Status(*error) : Status());
                              });
    }
    ErrorRecord userPresentableError(std::int64_t code,
                                     const std::optional<ErrorRecord>& underlying) override {
        return service_.userPresentableError(code, underlying);
    }
    std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& serviceName, const std::set<CoordinationClient>& clients,
        std::weak_ptr<InstallCoordinatorObserver> delegate) override {
        return service_.makeAppInstallObserver(serviceName, clients,
                                               observerFor(std::move(delegate)));
    }

  private:
    void tell(const Coordinator& found, const std::string& identifier, CoordinationClient client) {
        if (found.error) {
            watch_.coordinatorRefused(identifier, *found.error);
        } else if (found.coordinator && found.coordinator->creatorIdentifier() != client) {
            watch_.coordinatorIsOf(identifier, found.coordinator->creatorIdentifier());
        }
    }

    CoordinatorPointer watched(CoordinatorPointer coordinator) {
        if (coordinator == nullptr) return nullptr;
        return std::make_shared<WatchedCoordinator>(
            std::move(coordinator), [this](std::weak_ptr<InstallCoordinatorObserver> observer) {
                return observerFor(std::move(observer));
            });
    }

    // One for each observer of the plug-in's, kept here, as the service holds them weakly.
    std::weak_ptr<InstallCoordinatorObserver> observerFor(
        std::weak_ptr<InstallCoordinatorObserver> plugIn) {
        const std::lock_guard guard(mutex_);
        std::shared_ptr<WatchedObserver>& observer = observers_[plugIn];
        if (observer == nullptr) {
            observer = std::make_shared<WatchedObserver>(std::move(plugIn), watch_, gate_);
        }
        return observer;
    }

    InstallCoordinatorService& service_;
    SessionWatch& watch_;
    const std::shared_ptr<CallGate> gate_;
    std::mutex mutex_;
    // Guarded by mutex_.
    std::map<std::weak_ptr<InstallCoordinatorObserver>, std::shared_ptr<WatchedObserver>,
             std::owner_less<>>
        observers_;
};

}  // namespace

std::unique_ptr<InstallCoordinatorService> watchCoordination(InstallCoordinatorService& service,
                                                             SessionWatch& watch,
                                                             std::shared_ptr<CallGate> gate) {
    return std::make_unique<WatchedCoordination>(service, watch, std::move(gate));
}

}  // namespace appsync
