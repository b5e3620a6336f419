#pragma once

#include <cstddef>
#include <deque>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/SyncAsset.h"
#include "platform/TransferService.h"

namespace appsync {

/// What a session has still to send, in its order, and what the device asks of it meanwhile: to
/// stop a transfer, or to send something first.
///
/// The session fills it and takes from it on one thread; the service is callable on any.
class TransferQueue : public TransferService {
  public:
    // For the session.

    /// What is to be sent from now on, in this order. What the device has cancelled stays so.
    void fill(const std::vector<SyncAssetPointer>& assets);
    /// The next asset, which is under way from now on; null when nothing is left.
    [[nodiscard]] SyncAssetPointer next();
    /// What `next` gave last is no longer under way.
    void finish();
    /// Whether the device has cancelled the asset that is under way.
    [[nodiscard]] bool isCancelled() const;
    /// That cancel was of something else: the asset under way goes on.
    void dismissCancel();

    // From the device.

    [[nodiscard]] bool canCancelTransfers() const override { return true; }
    /// The transfer under way stops at its next piece; one that is still to come will not begin,
    /// and the session reports it as failed in its turn.
    void cancelTransferForFailedAsset(const SyncAsset& asset) override;

    [[nodiscard]] bool canPrioritizeAssets() const override { return true; }
    /// The asset becomes the next. Nothing changes when it is under way; an error when it is
    /// neither that nor still to be sent. The completion is called before this returns.
    void prioritizeAsset(const SyncAsset& asset, PrioritizeCompletion completion) override;

  private:
    [[nodiscard]] bool moveToFront(const std::string& identifier);

    mutable std::mutex mutex_;
    // Guarded by mutex_.
    std::deque<SyncAssetPointer> waiting_;
    std::string current_;  // empty when nothing is under way
    std::set<std::string> cancelled_;
};

}  // namespace appsync
