#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/InstallCoordinator.h"
#include "simulation/coordination/SimulatedCoordinationState.h"

namespace appsync {

class SimulatedCoordination;

/// A handle on a coordinator. In the recording the first argument of each call is its bundle
/// identifier.
class SimulatedCoordinator : public InstallCoordinator {
  public:
    using State = std::shared_ptr<SimulatedCoordinatorState>;

    SimulatedCoordinator(SimulatedCoordination& service, State state)
        : service_(service), state_(std::move(state)) {}

    [[nodiscard]] std::optional<std::string> bundleIdentifier() const override;
    [[nodiscard]] CoordinationClient creatorIdentifier() const override;
    [[nodiscard]] std::optional<ErrorRecord> error() const override;
    /// "Coordinator(com.example.a)". Asked for messages: not recorded.
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
    /// The identifier as it reads in the recording.
    [[nodiscard]] std::string name() const;
    void attach(SimulatedPromiseState& promise) const;

    SimulatedCoordination& service_;
    const State state_;
};

}  // namespace appsync
