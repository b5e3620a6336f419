#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/Error.h"
#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/InstallPlaceholder.h"
#include "platform/InstallPromises.h"

// The handles of the install-coordination service, and the service, whose calls go to another. For
// wrappers that change or watch some of the calls. A handle that is handed in is unwrapped: the
// target sees its own.

namespace appsync {

/// What stands behind a forwarding handle; any other handle itself.
template <typename Forwarding, typename Interface>
std::shared_ptr<Interface> unwrapped(const std::shared_ptr<Interface>& handle) {
    const auto* forwarding = dynamic_cast<const Forwarding*>(handle.get());
    return forwarding == nullptr ? handle : forwarding->target();
}

template <typename Interface>
class ForwardingPromise : public Interface {
  public:
    explicit ForwardingPromise(std::shared_ptr<Interface> target) : target_(std::move(target)) {}

    [[nodiscard]] std::string name() const override { return target_->name(); }
    [[nodiscard]] CoordinationClient clientIdentifier() const override {
        return target_->clientIdentifier();
    }
    [[nodiscard]] double percentComplete() const override { return target_->percentComplete(); }
    void setPercentComplete(double percent) override { target_->setPercentComplete(percent); }
    [[nodiscard]] bool isComplete() const override { return target_->isComplete(); }
    void setComplete() override { target_->setComplete(); }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        target_->cancelForReason(reason, client);
    }

    [[nodiscard]] const std::shared_ptr<Interface>& target() const { return target_; }

  private:
    const std::shared_ptr<Interface> target_;
};

class ForwardingPathTransferPromise : public ForwardingPromise<PathTransferPromise> {
  public:
    using ForwardingPromise::ForwardingPromise;
    [[nodiscard]] std::optional<FileURL> transferPath() const override {
        return target()->transferPath();
    }
    void setTransferPath(const FileURL& path) override { target()->setTransferPath(path); }
};

using ForwardingOutOfBandPromise = ForwardingPromise<OutOfBandPromise>;

class ForwardingPlaceholder : public InstallPlaceholder {
  public:
    explicit ForwardingPlaceholder(std::shared_ptr<InstallPlaceholder> target)
        : target_(std::move(target)) {}

    [[nodiscard]] std::string description() const override { return target_->description(); }
    Status setIconPromise(const std::shared_ptr<PathTransferPromise>& promise) override {
        return target_->setIconPromise(unwrapped<ForwardingPathTransferPromise>(promise));
    }
    Status setAttributes(const PlaceholderAttributes& attributes) override {
        return target_->setAttributes(attributes);
    }
    Status setMetadata(const std::optional<StoreMetadata>& metadata) override {
        return target_->setMetadata(metadata);
    }
    Status setSinf(const Bytes& sinf) override { return target_->setSinf(sinf); }
    Status setConfigurationComplete() override { return target_->setConfigurationComplete(); }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        target_->cancelForReason(reason, client);
    }

    [[nodiscard]] const std::shared_ptr<InstallPlaceholder>& target() const { return target_; }

  private:
    const std::shared_ptr<InstallPlaceholder> target_;
};

class ForwardingCoordinator : public InstallCoordinator {
  public:
    explicit ForwardingCoordinator(std::shared_ptr<InstallCoordinator> target)
        : target_(std::move(target)) {}

    [[nodiscard]] std::optional<std::string> bundleIdentifier() const override {
        return target_->bundleIdentifier();
    }
    [[nodiscard]] CoordinationClient creatorIdentifier() const override {
        return target_->creatorIdentifier();
    }
    [[nodiscard]] std::optional<ErrorRecord> error() const override { return target_->error(); }
    [[nodiscard]] std::string description() const override { return target_->description(); }
    void setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) override {
        target_->setObserver(std::move(observer));
    }
    [[nodiscard]] bool hasInstallOptions() const override { return target_->hasInstallOptions(); }
    Status setInstallOptions(const InstallOptions& options) override {
        return target_->setInstallOptions(options);
    }
    [[nodiscard]] bool hasInitialODRAssetPromises() const override {
        return target_->hasInitialODRAssetPromises();
    }
    Status setInitialODRAssetPromises(
        const std::vector<std::shared_ptr<PathTransferPromise>>& promises) override {
        std::vector<std::shared_ptr<PathTransferPromise>> targets;
        targets.reserve(promises.size());
        for (const auto& promise : promises) {
            targets.push_back(unwrapped<ForwardingPathTransferPromise>(promise));
        }
        return target_->setInitialODRAssetPromises(targets);
    }
    [[nodiscard]] std::shared_ptr<PathTransferPromise> appAssetPromise() const override {
        return target_->appAssetPromise();
    }
    Status setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise) override {
        return target_->setAppAssetPromise(unwrapped<ForwardingPathTransferPromise>(promise));
    }
    [[nodiscard]] std::optional<CoordinationClient> appAssetPromiseResponsibleClient()
        const override {
        return target_->appAssetPromiseResponsibleClient();
    }
    Status setAppAssetPromiseResponsibleClient(CoordinationClient client) override {
        return target_->setAppAssetPromiseResponsibleClient(client);
    }
    [[nodiscard]] bool hasUserDataPromise() const override { return target_->hasUserDataPromise(); }
    Status setUserDataPromise(const std::shared_ptr<OutOfBandPromise>& promise) override {
        return target_->setUserDataPromise(unwrapped<ForwardingOutOfBandPromise>(promise));
    }
    [[nodiscard]] bool hasPlaceholderPromise() const override {
        return target_->hasPlaceholderPromise();
    }
    Status setPlaceholderPromise(const std::shared_ptr<InstallPlaceholder>& placeholder) override {
        return target_->setPlaceholderPromise(unwrapped<ForwardingPlaceholder>(placeholder));
    }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        target_->cancelForReason(reason, client);
    }

    [[nodiscard]] const std::shared_ptr<InstallCoordinator>& target() const { return target_; }

  private:
    const std::shared_ptr<InstallCoordinator> target_;
};

/// Holds its target as an observer is held: weakly.
class ForwardingCoordinatorObserver : public InstallCoordinatorObserver {
  public:
    explicit ForwardingCoordinatorObserver(std::weak_ptr<InstallCoordinatorObserver> target)
        : target_(std::move(target)) {}

    [[nodiscard]] bool isExpired() const { return target_.expired(); }

    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) override {
        if (const auto to = target()) to->promiseDidBeginFulfillmentWithIdentifier(promise);
    }
    void coordinatorDidInstallPlaceholder(
        const std::shared_ptr<InstallCoordinator>& coordinator) override {
        if (const auto to = target()) to->coordinatorDidInstallPlaceholder(coordinator);
    }
    void coordinatorDidCompleteSuccessfully(
        const std::shared_ptr<InstallCoordinator>& coordinator) override {
        if (const auto to = target()) to->coordinatorDidCompleteSuccessfully(coordinator);
    }
    void coordinatorCanceledWithReason(const std::shared_ptr<InstallCoordinator>& coordinator,
                                       const ErrorRecord& reason,
                                       CoordinationClient client) override {
        if (const auto to = target())
            to->coordinatorCanceledWithReason(coordinator, reason, client);
    }
    void coordinatorShouldPrioritize(
        const std::shared_ptr<InstallCoordinator>& coordinator) override {
        if (const auto to = target()) to->coordinatorShouldPrioritize(coordinator);
    }

  protected:
    [[nodiscard]] std::shared_ptr<InstallCoordinatorObserver> target() const {
        return target_.lock();
    }

  private:
    const std::weak_ptr<InstallCoordinatorObserver> target_;
};

/// The target is borrowed. `handleFor` says what callers get for a coordinator.
class ForwardingCoordination : public InstallCoordinatorService {
  public:
    using Service = InstallCoordinatorService;

    explicit ForwardingCoordination(InstallCoordinatorService& target) : target_(target) {}

    [[nodiscard]] bool isCoordinationEnabled() override { return target_.isCoordinationEnabled(); }
    [[nodiscard]] Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                                          CoordinationClient client, Creation creation) override {
        Coordinator found = target_.coordinator(kind, identifier, client, creation);
        if (found.coordinator != nullptr) found.coordinator = handleFor(found.coordinator);
        return found;
    }
    [[nodiscard]] std::shared_ptr<InstallCoordinator> existingCoordinator(
        const std::string& identifier, CoordinationClient client) override {
        const auto found = target_.existingCoordinator(identifier, client);
        return found == nullptr ? nullptr : handleFor(found);
    }
    [[nodiscard]] std::shared_ptr<PathTransferPromise> makePathTransferPromise(
        const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
        std::uint64_t diskSpaceNeeded) override {
        return target_.makePathTransferPromise(name, client, path, diskSpaceNeeded);
    }
    [[nodiscard]] std::shared_ptr<OutOfBandPromise> makeOutOfBandPromise(
        const std::string& name, CoordinationClient client,
        std::uint64_t diskSpaceNeeded) override {
        return target_.makeOutOfBandPromise(name, client, diskSpaceNeeded);
    }
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> makeAppPlaceholder(
        const std::string& name, const std::string& identifier, std::uint64_t installType,
        CoordinationClient client) override {
        return target_.makeAppPlaceholder(name, identifier, installType, client);
    }
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override {
        target_.uninstallApp(identifier, std::move(completion));
    }
    [[nodiscard]] ErrorRecord userPresentableError(
        std::int64_t code, const std::optional<ErrorRecord>& underlying) override {
        return target_.userPresentableError(code, underlying);
    }
    [[nodiscard]] std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& serviceName, const std::set<CoordinationClient>& clients,
        std::weak_ptr<InstallCoordinatorObserver> delegate) override {
        return target_.makeAppInstallObserver(serviceName, clients, std::move(delegate));
    }

  protected:
    [[nodiscard]] InstallCoordinatorService& target() { return target_; }
    [[nodiscard]] virtual std::shared_ptr<InstallCoordinator> handleFor(
        const std::shared_ptr<InstallCoordinator>& coordinator) {
        return std::make_shared<ForwardingCoordinator>(coordinator);
    }

  private:
    InstallCoordinatorService& target_;
};

}  // namespace appsync
