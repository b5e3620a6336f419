#include "simulation/coordination/SimulatedPlaceholder.h"

#include <string_view>

#include "simulation/coordination/SimulatedCoordination.h"
#include "simulation/coordination/SimulatedPromises.h"
#include "simulation/files/SimulatedFileSystem.h"
#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {
constexpr std::string_view kPlaceholder = "InstallPlaceholder";
}

std::string SimulatedPlaceholder::description() const {
    return "Placeholder(" + state_->identifier + ")";
}

Status SimulatedPlaceholder::setIconPromise(const std::shared_ptr<PathTransferPromise>& promise) {
    const auto* simulated = dynamic_cast<const SimulatedPathTransferPromise*>(promise.get());
    RecordedCall call(service_.recorder_, kPlaceholder, "setIconPromise", state_->identifier,
                      simulated != nullptr ? simulated->state()->name : "(null)");
    Status status = service_.checkChange(CoordinationStep::IconPromise, *state_);
    if (status && simulated == nullptr) status = SimulatedCoordination::nothingGiven();
    if (!status) return call.result(status);
    state_->icon = simulated->state();
    const bool isThere = state_->icon->complete && state_->icon->path.has_value();
    state_->iconBytes =
        isThere ? service_.files_.contents(state_->icon->path->path()) : std::nullopt;
    return call.result(status);
}

Status SimulatedPlaceholder::setAttributes(const PlaceholderAttributes& attributes) {
    RecordedCall call(service_.recorder_, kPlaceholder, "setAttributes", state_->identifier,
                      attributes);
    Status status = service_.checkChange(CoordinationStep::Attributes, *state_);
    if (status) state_->attributes = attributes;
    return call.result(status);
}

Status SimulatedPlaceholder::setMetadata(const std::optional<StoreMetadata>& metadata) {
    RecordedCall call(service_.recorder_, kPlaceholder, "setMetadata", state_->identifier,
                      metadata);
    Status status = service_.checkChange(CoordinationStep::Metadata, *state_);
    if (!status) return call.result(status);
    state_->metadataSet = true;
    state_->metadata = metadata;
    return call.result(status);
}

Status SimulatedPlaceholder::setSinf(const Bytes& sinf) {
    RecordedCall call(service_.recorder_, kPlaceholder, "setSinf", state_->identifier, sinf);
    Status status = service_.checkChange(CoordinationStep::Sinf, *state_);
    if (status) state_->sinf = sinf;
    return call.result(status);
}

Status SimulatedPlaceholder::setConfigurationComplete() {
    RecordedCall call(service_.recorder_, kPlaceholder, "setConfigurationComplete",
                      state_->identifier);
    Status status = service_.checkChange(CoordinationStep::ConfigurationComplete, *state_);
    if (!status) return call.result(status);
    state_->configurationComplete = true;
    service_.tell("a configuration", state_->identifier, Persistence::Soon);
    if (const auto coordinator = state_->coordinator.lock()) service_.advance(coordinator);
    return call.result(status);
}

void SimulatedPlaceholder::cancelForReason(const ErrorRecord& reason, CoordinationClient client) {
    const RecordedCall call(service_.recorder_, kPlaceholder, "cancelForReason", state_->identifier,
                            reason, client);
    if (!state_->cancelled) state_->cancelled = SimulatedCancel{reason, client};
}

}  // namespace appsync
