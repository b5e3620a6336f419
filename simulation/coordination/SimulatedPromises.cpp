#include "simulation/coordination/SimulatedPromises.h"

#include <type_traits>

#include "simulation/coordination/SimulatedCoordination.h"
#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {

constexpr std::string_view kPathTransferPromise = "PathTransferPromise";
template <typename Interface>
constexpr std::string_view kPromise = std::is_same_v<Interface, PathTransferPromise>
                                          ? kPathTransferPromise
                                          : std::string_view("OutOfBandPromise");

}  // namespace

template <typename Interface>
std::string SimulatedPromise<Interface>::name() const {
    RecordedCall call(service_.recorder_, kPromise<Interface>, "name", state_->name);
    return call.result(state_->name);
}

template <typename Interface>
CoordinationClient SimulatedPromise<Interface>::clientIdentifier() const {
    RecordedCall call(service_.recorder_, kPromise<Interface>, "clientIdentifier", state_->name);
    return call.result(state_->client);
}

template <typename Interface>
double SimulatedPromise<Interface>::percentComplete() const {
    RecordedCall call(service_.recorder_, kPromise<Interface>, "percentComplete", state_->name);
    return call.result(state_->percent);
}

template <typename Interface>
void SimulatedPromise<Interface>::setPercentComplete(double percent) {
    [[maybe_unused]] const RecordedCall call(service_.recorder_, kPromise<Interface>,
                                             "setPercentComplete", state_->name, percent);
    if (state_->over) return;
    state_->percent = percent;
    service_.tell("a promise's progress", state_->name, Persistence::Soon);
}

template <typename Interface>
bool SimulatedPromise<Interface>::isComplete() const {
    RecordedCall call(service_.recorder_, kPromise<Interface>, "isComplete", state_->name);
    return call.result(state_->complete);
}

template <typename Interface>
void SimulatedPromise<Interface>::setComplete() {
    [[maybe_unused]] const RecordedCall call(service_.recorder_, kPromise<Interface>, "setComplete",
                                             state_->name);
    if (state_->over || !state_->isAwaited()) return;
    state_->complete = true;
    service_.tell("a promise kept", state_->name, Persistence::Committed);
    if (const auto coordinator = state_->coordinator.lock()) service_.advance(coordinator);
}

template <typename Interface>
void SimulatedPromise<Interface>::cancelForReason(const ErrorRecord& reason,
                                                  CoordinationClient client) {
    [[maybe_unused]] const RecordedCall call(service_.recorder_, kPromise<Interface>,
                                             "cancelForReason", state_->name, reason, client);
    service_.cancelPromise(*state_, reason, client);
}

template class SimulatedPromise<PathTransferPromise>;
template class SimulatedPromise<OutOfBandPromise>;

std::optional<FileURL> SimulatedPathTransferPromise::transferPath() const {
    RecordedCall call(service_.recorder_, kPathTransferPromise, "transferPath", state_->name);
    return call.result(state_->path);
}

void SimulatedPathTransferPromise::setTransferPath(const FileURL& path) {
    const RecordedCall call(service_.recorder_, kPathTransferPromise, "setTransferPath",
                            state_->name, path);
    if (state_->over) return;
    state_->path = path;
    service_.tell("a promise's path", state_->name, Persistence::Soon);
}

}  // namespace appsync
