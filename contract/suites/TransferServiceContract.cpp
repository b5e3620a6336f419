#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <memory>
#include <string>

#include "contract/DeviceContract.h"
#include "platform/SyncAsset.h"
#include "platform/SyncHost.h"
#include "platform/TransferService.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;

class TransferServiceContract : public DeviceContract {
  protected:
    void SetUp() override {
        checks(
            "platform/SyncHost.h",
            "The host's device service; null where there is none. It lives as long as the host.");
        transfers_ = services_.host.transferService();
        ASSERT_NE(transfers_, nullptr);
    }
    /// What the plug-in hands over.
    static SyncAsset handle() {
        SyncAsset asset;
        asset.identifier = "com.example.a";
        asset.dataclass = kApplicationDataclass;
        return asset;
    }

    TransferService* transfers_ = nullptr;
};

APPSYNC_CONTRACT_SUITE(TransferServiceContract, devicePorts({OptionalService::Transfers}));

TEST_P(TransferServiceContract, WhatIsNotUnderWayMayBeCancelled) {
    checks("platform/TransferService.h", "Not an error when it is not under way.");
    if (!transfers_->canCancelTransfers()) GTEST_SKIP() << "the service cancels no transfer";
    transfers_->cancelTransferForFailedAsset(handle());
}

TEST_P(TransferServiceContract, ACompletionIsCalledOnce) {
    checks("platform/TransferService.h",
           "Called once, on any thread, before the operation returns or after;");
    if (!transfers_->canPrioritizeAssets()) GTEST_SKIP() << "the service prioritises no asset";
    const std::shared_ptr<Semaphore> called = services_.queues.makeSemaphore(0);
    const auto calls = std::make_shared<std::atomic<int>>(0);
    transfers_->prioritizeAsset(handle(), [called, calls](const ErrorRecord*) {
        ++*calls;
        called->signal();
    });
    EXPECT_TRUE(called->wait());
    pause(services_.queues, 20ms);
    EXPECT_EQ(*calls, 1);
}

}  // namespace

void linkTransferServiceContract() {}

}  // namespace appsync
