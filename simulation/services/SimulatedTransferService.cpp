#include "simulation/services/SimulatedTransferService.h"

#include <optional>
#include <utility>

#include "platform/SyncAsset.h"
#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {
constexpr std::string_view kTransferService = "TransferService";
}

bool SimulatedTransferService::canCancelTransfers() const {
    RecordedCall call(recorder_, kTransferService, "canCancelTransfers");
    return call.result(canCancel_);
}

void SimulatedTransferService::cancelTransferForFailedAsset(const SyncAsset& asset) {
    const RecordedCall call(recorder_, kTransferService, "cancelTransferForFailedAsset", asset);
    if (!canCancel_) throw SimulationFailure("this device service cancels no transfers");
}

bool SimulatedTransferService::canPrioritizeAssets() const {
    RecordedCall call(recorder_, kTransferService, "canPrioritizeAssets");
    return call.result(canPrioritize_);
}

void SimulatedTransferService::prioritizeAsset(const SyncAsset& asset,
                                               PrioritizeCompletion completion) {
    const RecordedCall call(recorder_, kTransferService, "prioritizeAsset", asset);
    if (!canPrioritize_) throw SimulationFailure("this device service prioritizes no assets");
    std::optional<ErrorRecord> error;
    if (auto& failures = failures_[asset.identifier]; !failures.empty()) {
        error = std::move(failures.front());
        failures.pop_front();
    }
    recorder_.scheduler().spawn("device service",
                                [completion = std::move(completion), error = std::move(error)] {
                                    completion(error ? &*error : nullptr);
                                });
}

void SimulatedTransferService::failNextPrioritize(const std::string& identifier,
                                                  ErrorRecord error) {
    failures_[identifier].push_back(std::move(error));
}

}  // namespace appsync
