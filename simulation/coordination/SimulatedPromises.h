#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/InstallPromises.h"
#include "simulation/coordination/SimulatedCoordinationState.h"

namespace appsync {

class SimulatedCoordination;

/// A handle on a promise. In the recording the first argument of each call is its name.
template <typename Interface>
class SimulatedPromise : public Interface {
  public:
    using State = std::shared_ptr<SimulatedPromiseState>;

    SimulatedPromise(SimulatedCoordination& service, State state)
        : service_(service), state_(std::move(state)) {}

    [[nodiscard]] std::string name() const override;
    [[nodiscard]] CoordinationClient clientIdentifier() const override;
    [[nodiscard]] double percentComplete() const override;
    void setPercentComplete(double percent) override;
    [[nodiscard]] bool isComplete() const override;
    void setComplete() override;
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override;

    [[nodiscard]] const State& state() const { return state_; }

  protected:
    SimulatedCoordination& service_;
    const State state_;
};

class SimulatedPathTransferPromise : public SimulatedPromise<PathTransferPromise> {
  public:
    using SimulatedPromise::SimulatedPromise;

    [[nodiscard]] std::optional<FileURL> transferPath() const override;
    void setTransferPath(const FileURL& path) override;
};

using SimulatedOutOfBandPromise = SimulatedPromise<OutOfBandPromise>;

}  // namespace appsync
