#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "platform/InstallPlaceholder.h"
#include "simulation/coordination/SimulatedCoordinationState.h"

namespace appsync {

class SimulatedCoordination;

/// A handle on a placeholder. In the recording the first argument of each call is its bundle
/// identifier.
class SimulatedPlaceholder : public InstallPlaceholder {
  public:
    using State = std::shared_ptr<SimulatedPlaceholderState>;

    SimulatedPlaceholder(SimulatedCoordination& service, State state)
        : service_(service), state_(std::move(state)) {}

    /// "Placeholder(com.example.a)". Asked for messages: not recorded.
    [[nodiscard]] std::string description() const override;
    Status setIconPromise(const std::shared_ptr<PathTransferPromise>& promise) override;
    Status setAttributes(const PlaceholderAttributes& attributes) override;
    Status setMetadata(const std::optional<StoreMetadata>& metadata) override;
    Status setSinf(const Bytes& sinf) override;
    Status setConfigurationComplete() override;
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override;

    [[nodiscard]] const State& state() const { return state_; }

  private:
    SimulatedCoordination& service_;
    const State state_;
};

}  // namespace appsync
