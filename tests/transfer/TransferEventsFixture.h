#pragma once

#include <set>
#include <string>
#include <vector>

#include "tests/client/AppsClientFixture.h"

namespace appsync {

/// A client for which the package of one application is under way: its placeholder stands, and the
/// todo list asks for it.
class TransferEventsFixture : public AppsClientFixture {
  protected:
    using Values = SimulatedProgressRecord::Values;

    TransferEventsFixture() {
        platform_.files.addDirectory(std::string(kWorkArea));
        setTodoList(PropertyList::array({todoEntry(kA, "install")}));
        platform_.registry.addPlaceholder(kA, kInstallTypeSync);
        platform_.runUntilIdle();
        platform_.clearRecording();
    }
    void progress(double fraction) {
        client_->assetTransferUpdatedProgress(receivedAsset(kA), fraction);
    }
    void succeed(const SyncAssetPointer& asset) {
        client_->assetTransferSucceeded(asset, true, nullptr);
        platform_.runUntilIdle();
    }
    void fail(const SyncAssetPointer& asset) {
        client_->assetTransferSucceeded(asset, false, &error_);
    }
    SyncAssetPointer restoreAsset(unsigned completedParts) {
        auto asset = receivedAsset(kA);
        asset->isRestore = true;
        asset->completedParts = completedParts;
        return asset;
    }
    [[nodiscard]] Values values() const {
        return platform_.registry.progress(kA).value_or(Values{99, 99, 99, 99});
    }
    [[nodiscard]] std::vector<std::string> installs() const {
        return platform_.callsTo({"AppRegistry.installPackage"});
    }
    [[nodiscard]] std::vector<std::string> uninstalls() const {
        return platform_.callsTo({"AppRegistry.uninstallApplication"});
    }
    [[nodiscard]] std::set<std::string> outstanding() const {
        return AppsClientTestAccess::outstandingHFTTransfers(*client_);
    }

    const ErrorRecord error_ = ErrorRecord::make("Transport", 54, "the cable was pulled");
};

}  // namespace appsync
