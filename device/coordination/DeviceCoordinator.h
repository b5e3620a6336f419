#pragma once

#include <atomic>
#include <memory>

#include "platform/InstallCoordinator.h"

namespace appsync {

class CoordinationBook;
class LiveCoordinator;

/// A handle on a coordinator of a device's coordination service. One of a restore that was given a
/// placeholder holds back what the service has to tell of it, until whoever holds the handle has
/// done what it does next: makes somebody responsible for the package, or lets the handle go.
class DeviceCoordinator final : public InstallCoordinator {
  public:
    DeviceCoordinator(std::shared_ptr<CoordinationBook> book,
                      std::shared_ptr<LiveCoordinator> coordinator)
        : book_(std::move(book)), coordinator_(std::move(coordinator)) {}
    DeviceCoordinator(const DeviceCoordinator&) = delete;
    DeviceCoordinator& operator=(const DeviceCoordinator&) = delete;
    ~DeviceCoordinator() override;

    [[nodiscard]] std::optional<std::string> bundleIdentifier() const override;
    [[nodiscard]] CoordinationClient creatorIdentifier() const override;
    [[nodiscard]] std::optional<ErrorRecord> error() const override;
    [[nodiscard]] std::string description() const override;

    void setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) override;

    [[nodiscard]] bool hasInstallOptions() const override;
    Status setInstallOptions(const InstallOptions& options) override;
    [[nodiscard]] bool hasInitialODRAssetPromises() const override;
    Status setInitialODRAssetPromises(
        const std::vector<std::shared_ptr<PathTransferPromise>>& promises) override;
    [[nodiscard]] std::shared_ptr<PathTransferPromise> appAssetPromise() const override;
    Status setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise) override;
    [[nodiscard]] std::optional<CoordinationClient> appAssetPromiseResponsibleClient()
        const override;
    Status setAppAssetPromiseResponsibleClient(CoordinationClient client) override;
    [[nodiscard]] bool hasUserDataPromise() const override;
    Status setUserDataPromise(const std::shared_ptr<OutOfBandPromise>& promise) override;
    [[nodiscard]] bool hasPlaceholderPromise() const override;
    Status setPlaceholderPromise(const std::shared_ptr<InstallPlaceholder>& placeholder) override;

    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override;

  private:
    void tellNews();

    const std::shared_ptr<CoordinationBook> book_;
    const std::shared_ptr<LiveCoordinator> coordinator_;
    std::atomic<bool> holdsNews_ = false;
};

}  // namespace appsync
