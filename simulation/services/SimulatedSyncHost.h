#pragma once

#include <functional>
#include <string>
#include <utility>

#include "platform/Error.h"
#include "platform/SyncHost.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

/// The process that loads the plug-in: the daemon itself, unless the test says otherwise.
class SimulatedSyncHost : public SyncHost {
  public:
    using RecoverableTest = std::function<bool(const ErrorRecord&)>;

    /// `transfers` is the device service, borrowed; null for a host that has none.
    explicit SimulatedSyncHost(Recorder& recorder, TransferService* transfers = nullptr)
        : recorder_(recorder), transfers_(transfers) {}

    [[nodiscard]] std::string mainBundleIdentifier() const override;
    [[nodiscard]] std::string pluginBundleIdentifier() const override;
    [[nodiscard]] bool isRecoverableError(const ErrorRecord& error) const override;
    [[nodiscard]] TransferService* transferService() override;

    // The test's side; not recorded.
    void setMainBundleIdentifier(std::string identifier) { main_ = std::move(identifier); }
    void setPluginBundleIdentifier(std::string identifier) { plugin_ = std::move(identifier); }
    /// At first no error is recoverable.
    void setRecoverableTest(RecoverableTest test) { recoverable_ = std::move(test); }
    void setTransferService(TransferService* transfers) { transfers_ = transfers; }

  private:
    Recorder& recorder_;
    TransferService* transfers_;
    std::string main_ = "com.korvu.trd";
    std::string plugin_ = "com.korvu.trd.AppSync";
    RecoverableTest recoverable_ = [](const ErrorRecord&) { return false; };
};

}  // namespace appsync
