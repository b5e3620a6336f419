#pragma once

#include <chrono>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <utility>

#include "checked/BreachBook.h"
#include "checked/CheckedCompletion.h"
#include "platform/SyncHost.h"
#include "platform/TransferService.h"
#include "platform/WorkQueues.h"

namespace appsync {

/// Looks at the completions of a transfer service.
class CheckedTransferService final : public TransferService {
  public:
    CheckedTransferService(TransferService& transfers, WorkQueues& queues,
                           std::shared_ptr<BreachBook> book, std::chrono::nanoseconds patience)
        : transfers_(transfers), queues_(queues), book_(std::move(book)), patience_(patience) {}

    [[nodiscard]] bool canCancelTransfers() const override {
        return transfers_.canCancelTransfers();
    }
    void cancelTransferForFailedAsset(const SyncAsset& asset) override {
        transfers_.cancelTransferForFailedAsset(asset);
    }
    [[nodiscard]] bool canPrioritizeAssets() const override {
        return transfers_.canPrioritizeAssets();
    }
    void prioritizeAsset(const SyncAsset& asset, PrioritizeCompletion completion) override {
        transfers_.prioritizeAsset(
            asset,
            checkedCompletion(book_, queues_, patience_, "prioritizeAsset", std::move(completion),
                              [book = book_](const std::string& seen) {
                                  book->broken("platform/TransferService.h",
                                               "Called once, on any thread, before the operation "
                                               "returns or after;",
                                               seen);
                              }));
    }

  private:
    TransferService& transfers_;
    WorkQueues& queues_;
    const std::shared_ptr<BreachBook> book_;
    const std::chrono::nanoseconds patience_;
};

/// Gives the host's transfer service, looked at.
class CheckedSyncHost final : public SyncHost {
  public:
    CheckedSyncHost(SyncHost& host, WorkQueues& queues, std::shared_ptr<BreachBook> book,
                    std::chrono::nanoseconds patience)
        : host_(host), queues_(queues), book_(std::move(book)), patience_(patience) {}

    [[nodiscard]] std::string mainBundleIdentifier() const override {
        return host_.mainBundleIdentifier();
    }
    [[nodiscard]] std::string pluginBundleIdentifier() const override {
        return host_.pluginBundleIdentifier();
    }
    [[nodiscard]] bool isRecoverableError(const ErrorRecord& error) const override {
        return host_.isRecoverableError(error);
    }
    [[nodiscard]] TransferService* transferService() override {
        TransferService* const transfers = host_.transferService();
        if (transfers == nullptr) return nullptr;
        const std::lock_guard guard(mutex_);
        auto& checked = checked_[transfers];
        if (checked == nullptr) {
            checked =
                std::make_unique<CheckedTransferService>(*transfers, queues_, book_, patience_);
        }
        return checked.get();
    }

  private:
    SyncHost& host_;
    WorkQueues& queues_;
    const std::shared_ptr<BreachBook> book_;
    const std::chrono::nanoseconds patience_;
    std::mutex mutex_;
    // Each that the host has given; protected by mutex_.
    std::map<TransferService*, std::unique_ptr<CheckedTransferService>> checked_;
};

}  // namespace appsync
