#include "simulation/coordination/SimulatedCoordinator.h"

#include <string_view>

#include "simulation/coordination/SimulatedCoordination.h"
#include "simulation/coordination/SimulatedPlaceholder.h"
#include "simulation/coordination/SimulatedPromises.h"
#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {

constexpr std::string_view kCoordinator = "InstallCoordinator";

/// The record behind a handle; null when there is none.
template <typename Handle, typename Interface>
typename Handle::State stateOf(const std::shared_ptr<Interface>& handle) {
    if (handle == nullptr) return nullptr;
    const auto* simulated = dynamic_cast<const Handle*>(handle.get());
    if (simulated == nullptr) throw SimulationFailure("the object is of another service");
    return simulated->state();
}

template <typename State>
std::string nameOf(const State& state) {
    return state != nullptr ? state->name : "(null)";
}

using PromiseStates = std::vector<std::shared_ptr<SimulatedPromiseState>>;

PromiseStates statesOf(const std::vector<std::shared_ptr<PathTransferPromise>>& promises) {
    PromiseStates states;
    for (const auto& promise : promises) {
        states.push_back(stateOf<SimulatedPathTransferPromise>(promise));
        if (states.back() == nullptr) throw SimulationFailure("a promise of the list is null");
    }
    return states;
}

std::string namesOf(const PromiseStates& states) {
    std::string text = "[";
    for (const auto& state : states) text += (text.size() > 1 ? ", " : "") + state->name;
    return text + "]";
}

}  // namespace

std::string SimulatedCoordinator::name() const { return state_->identifier.value_or("(null)"); }

std::optional<std::string> SimulatedCoordinator::bundleIdentifier() const {
    RecordedCall call(service_.recorder_, kCoordinator, "bundleIdentifier", name());
    return call.result(state_->identifier);
}

CoordinationClient SimulatedCoordinator::creatorIdentifier() const {
    RecordedCall call(service_.recorder_, kCoordinator, "creatorIdentifier", name());
    return call.result(state_->creator);
}

std::optional<ErrorRecord> SimulatedCoordinator::error() const {
    RecordedCall call(service_.recorder_, kCoordinator, "error", name());
    return call.result(state_->error);
}

std::string SimulatedCoordinator::description() const { return "Coordinator(" + name() + ")"; }

void SimulatedCoordinator::setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) {
    const RecordedCall call(service_.recorder_, kCoordinator, "setObserver", name());
    state_->observer = std::move(observer);
}

bool SimulatedCoordinator::hasInstallOptions() const {
    RecordedCall call(service_.recorder_, kCoordinator, "hasInstallOptions", name());
    return call.result(service_.has(CoordinationStep::InstallOptions, *state_,
                                    state_->installOptions.has_value()));
}

Status SimulatedCoordinator::setInstallOptions(const InstallOptions& options) {
    RecordedCall call(service_.recorder_, kCoordinator, "setInstallOptions", name(), options);
    Status status = service_.checkSet(CoordinationStep::InstallOptions, *state_,
                                      state_->installOptions.has_value());
    if (!status) return call.result(status);
    state_->installOptions = options;
    service_.tell("install options", name(), Persistence::Soon);
    service_.advance(state_);
    return call.result(status);
}

bool SimulatedCoordinator::hasInitialODRAssetPromises() const {
    RecordedCall call(service_.recorder_, kCoordinator, "hasInitialODRAssetPromises", name());
    return call.result(service_.has(CoordinationStep::InitialODRAssetPromises, *state_,
                                    state_->initialODRAssets.has_value()));
}

Status SimulatedCoordinator::setInitialODRAssetPromises(
    const std::vector<std::shared_ptr<PathTransferPromise>>& promises) {
    PromiseStates states = statesOf(promises);
    RecordedCall call(service_.recorder_, kCoordinator, "setInitialODRAssetPromises", name(),
                      namesOf(states));
    Status status = service_.checkSet(CoordinationStep::InitialODRAssetPromises, *state_,
                                      state_->initialODRAssets.has_value());
    if (!status) return call.result(status);
    for (const auto& state : states) state->coordinator = state_;
    state_->initialODRAssets = std::move(states);
    service_.tell("the initial assets", name(), Persistence::Soon);
    service_.advance(state_);
    return call.result(status);
}

std::shared_ptr<PathTransferPromise> SimulatedCoordinator::appAssetPromise() const {
    RecordedCall call(service_.recorder_, kCoordinator, "appAssetPromise", name());
    std::shared_ptr<PathTransferPromise> promise;
    if (service_.has(CoordinationStep::AppAssetPromise, *state_, state_->appAsset != nullptr) &&
        state_->appAsset != nullptr) {
        promise = std::make_shared<SimulatedPathTransferPromise>(service_, state_->appAsset);
    }
    std::string text = promise != nullptr ? state_->appAsset->name : "(null)";
    return call.result(std::move(promise), std::move(text));
}

Status SimulatedCoordinator::setAppAssetPromise(
    const std::shared_ptr<PathTransferPromise>& promise) {
    const auto asset = stateOf<SimulatedPathTransferPromise>(promise);
    RecordedCall call(service_.recorder_, kCoordinator, "setAppAssetPromise", name(),
                      nameOf(asset));
    Status status =
        service_.checkSet(CoordinationStep::AppAssetPromise, *state_, state_->appAsset != nullptr);
    if (status && asset == nullptr) status = SimulatedCoordination::nothingGiven();
    if (!status) return call.result(status);
    asset->coordinator = state_;
    state_->appAsset = asset;
    service_.tell("the package promise", name(), Persistence::Soon);
    service_.advance(state_);
    return call.result(status);
}

std::optional<CoordinationClient> SimulatedCoordinator::appAssetPromiseResponsibleClient() const {
    RecordedCall call(service_.recorder_, kCoordinator, "appAssetPromiseResponsibleClient", name());
    return call.result(state_->responsibleClient);
}

Status SimulatedCoordinator::setAppAssetPromiseResponsibleClient(CoordinationClient client) {
    RecordedCall call(service_.recorder_, kCoordinator, "setAppAssetPromiseResponsibleClient",
                      name(), client);
    Status status = service_.checkSet(CoordinationStep::AppAssetPromiseResponsibleClient, *state_,
                                      state_->responsibleClient.has_value());
    if (status) {
        state_->responsibleClient = client;
        service_.tell("who brings the package", name(), Persistence::Soon);
    }
    return call.result(status);
}

bool SimulatedCoordinator::hasUserDataPromise() const {
    RecordedCall call(service_.recorder_, kCoordinator, "hasUserDataPromise", name());
    return call.result(
        service_.has(CoordinationStep::UserDataPromise, *state_, state_->userData != nullptr));
}

Status SimulatedCoordinator::setUserDataPromise(const std::shared_ptr<OutOfBandPromise>& promise) {
    const auto data = stateOf<SimulatedOutOfBandPromise>(promise);
    RecordedCall call(service_.recorder_, kCoordinator, "setUserDataPromise", name(), nameOf(data));
    Status status =
        service_.checkSet(CoordinationStep::UserDataPromise, *state_, state_->userData != nullptr);
    if (status && data == nullptr) status = SimulatedCoordination::nothingGiven();
    if (!status) return call.result(status);
    data->coordinator = state_;
    state_->userData = data;
    service_.tell("the data promise", name(), Persistence::Soon);
    service_.advance(state_);
    return call.result(status);
}

bool SimulatedCoordinator::hasPlaceholderPromise() const {
    RecordedCall call(service_.recorder_, kCoordinator, "hasPlaceholderPromise", name());
    return call.result(service_.has(CoordinationStep::PlaceholderPromise, *state_,
                                    state_->placeholder != nullptr));
}

Status SimulatedCoordinator::setPlaceholderPromise(
    const std::shared_ptr<InstallPlaceholder>& placeholder) {
    const auto given = stateOf<SimulatedPlaceholder>(placeholder);
    RecordedCall call(service_.recorder_, kCoordinator, "setPlaceholderPromise", name(),
                      nameOf(given));
    Status status = service_.checkSet(CoordinationStep::PlaceholderPromise, *state_,
                                      state_->placeholder != nullptr);
    if (status) status = SimulatedCoordination::checkPlaceholder(*state_, given.get());
    if (!status) return call.result(status);
    given->coordinator = state_;
    service_.willHandPlaceholder(*state_);
    state_->placeholder = given;
    service_.tell("a placeholder handed in", name(), Persistence::Soon);
    service_.advance(state_);
    return call.result(status);
}

void SimulatedCoordinator::cancelForReason(const ErrorRecord& reason, CoordinationClient client) {
    const RecordedCall call(service_.recorder_, kCoordinator, "cancelForReason", name(), reason,
                            client);
    service_.cancelNow(state_, reason, client);
}

}  // namespace appsync
