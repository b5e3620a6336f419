#include "simulation/services/SimulatedSyncHost.h"

#include <string_view>

#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {
constexpr std::string_view kSyncHost = "SyncHost";
}

std::string SimulatedSyncHost::mainBundleIdentifier() const {
    RecordedCall call(recorder_, kSyncHost, "mainBundleIdentifier");
    return call.result(main_);
}

// Asked with every message: not worth an entry in the recording.
std::string SimulatedSyncHost::pluginBundleIdentifier() const { return plugin_; }

bool SimulatedSyncHost::isRecoverableError(const ErrorRecord& error) const {
    RecordedCall call(recorder_, kSyncHost, "isRecoverableError", error);
    return call.result(recoverable_(error));
}

TransferService* SimulatedSyncHost::transferService() {
    RecordedCall call(recorder_, kSyncHost, "transferService");
    return call.result(transfers_, transfers_ != nullptr ? "a service" : "(null)");
}

}  // namespace appsync
