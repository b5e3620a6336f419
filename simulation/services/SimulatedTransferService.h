#pragma once

#include <deque>
#include <map>
#include <string>

#include "platform/Error.h"
#include "platform/TransferService.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

/// The SyncHost's device service: takes note. It offers both operations until the test says
/// otherwise; whoever calls one that is not offered breaks a rule. Completions are called by tasks
/// named "device service".
class SimulatedTransferService : public TransferService {
  public:
    explicit SimulatedTransferService(Recorder& recorder) : recorder_(recorder) {}

    [[nodiscard]] bool canCancelTransfers() const override;
    void cancelTransferForFailedAsset(const SyncAsset& asset) override;
    [[nodiscard]] bool canPrioritizeAssets() const override;
    void prioritizeAsset(const SyncAsset& asset, PrioritizeCompletion completion) override;

    // The test's side; not recorded.
    void setCanCancelTransfers(bool offered) { canCancel_ = offered; }
    void setCanPrioritizeAssets(bool offered) { canPrioritize_ = offered; }
    /// The failures of an identifier are used up one by one, in the order given.
    void failNextPrioritize(const std::string& identifier, ErrorRecord error);

  private:
    Recorder& recorder_;
    bool canCancel_ = true;
    bool canPrioritize_ = true;
    std::map<std::string, std::deque<ErrorRecord>> failures_;
};

}  // namespace appsync
