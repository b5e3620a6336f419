#include "simulation/services/SimulatedProgressRecord.h"

#include <string_view>
#include <utility>

#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {
constexpr std::string_view kProgressRecord = "InstallProgressRecord";
}

SimulatedProgressRecord::SimulatedProgressRecord(Recorder& recorder, std::string identifier,
                                                 std::function<void()> stateChanged)
    : recorder_(recorder),
      identifier_(std::move(identifier)),
      stateChanged_(std::move(stateChanged)) {}

std::uint64_t SimulatedProgressRecord::installState() const {
    RecordedCall call(recorder_, kProgressRecord, "installState", identifier_);
    return call.result(values_.state);
}

void SimulatedProgressRecord::setInstallState(std::uint64_t state) {
    const RecordedCall call(recorder_, kProgressRecord, "setInstallState", identifier_, state);
    if (over_) return;
    values_.state = state;
    tell();
    stateChanged_();
}

std::uint64_t SimulatedProgressRecord::installPhase() const {
    RecordedCall call(recorder_, kProgressRecord, "installPhase", identifier_);
    return call.result(values_.phase);
}

void SimulatedProgressRecord::setInstallPhase(std::uint64_t phase) {
    const RecordedCall call(recorder_, kProgressRecord, "setInstallPhase", identifier_, phase);
    if (over_) return;
    values_.phase = phase;
    tell();
}

std::int64_t SimulatedProgressRecord::totalUnitCount() const {
    RecordedCall call(recorder_, kProgressRecord, "totalUnitCount", identifier_);
    return call.result(values_.total);
}

void SimulatedProgressRecord::setTotalUnitCount(std::int64_t count) {
    const RecordedCall call(recorder_, kProgressRecord, "setTotalUnitCount", identifier_, count);
    if (!over_) values_.total = count;
}

std::int64_t SimulatedProgressRecord::completedUnitCount() const {
    RecordedCall call(recorder_, kProgressRecord, "completedUnitCount", identifier_);
    return call.result(values_.completed);
}

void SimulatedProgressRecord::setCompletedUnitCount(std::int64_t count) {
    const RecordedCall call(recorder_, kProgressRecord, "setCompletedUnitCount", identifier_,
                            count);
    if (!over_) values_.completed = count;
}

void SimulatedProgressRecord::cancel() {
    const RecordedCall call(recorder_, kProgressRecord, "cancel", identifier_);
    if (over_) return;
    values_.state = kInstallStateCanceled;
    tell();
    stateChanged_();
}

std::string SimulatedProgressRecord::description() const {
    RecordedCall call(recorder_, kProgressRecord, "description", identifier_);
    return call.result(text());
}

void SimulatedProgressRecord::tell() const {
    recorder_.recordsChanged("the progress of " + identifier_, Persistence::Soon);
}

void SimulatedProgressRecord::end(std::uint64_t state) {
    if (over_) return;
    values_.state = state;
    over_ = true;
}

std::string SimulatedProgressRecord::text() const {
    return identifier_ + " state=" + std::to_string(values_.state) +
           " phase=" + std::to_string(values_.phase) + " " + std::to_string(values_.completed) +
           "/" + std::to_string(values_.total);
}

}  // namespace appsync
