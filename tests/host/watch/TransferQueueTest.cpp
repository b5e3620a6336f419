#include "host/watch/TransferQueue.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/Error.h"

namespace appsync {
namespace {

using testing::ElementsAre;

SyncAssetPointer asset(const std::string& identifier) {
    auto made = std::make_shared<SyncAsset>();
    made->identifier = identifier;
    return made;
}

class TransferQueueTest : public testing::Test {
  protected:
    TransferQueueTest() { queue.fill({asset("com.a"), asset("com.b"), asset("com.c")}); }

    std::string next() {
        const SyncAssetPointer taken = queue.next();
        return taken != nullptr ? taken->identifier : "";
    }

    // The errors with which the completion was called; "" for a success.
    std::vector<std::string> prioritize(const std::string& identifier) {
        std::vector<std::string> calls;
        queue.prioritizeAsset(*asset(identifier), [&](const ErrorRecord* error) {
            calls.push_back(error != nullptr ? error->description() : "");
        });
        return calls;
    }

    TransferQueue queue;
};

TEST_F(TransferQueueTest, GivesTheAssetsInTheirOrder) {
    EXPECT_EQ(next(), "com.a");
    EXPECT_EQ(next(), "com.b");
    EXPECT_EQ(next(), "com.c");
    EXPECT_EQ(queue.next(), nullptr);
}

TEST_F(TransferQueueTest, WhatIsPrioritizedComesNext) {
    EXPECT_EQ(next(), "com.a");
    EXPECT_THAT(prioritize("com.c"), ElementsAre(""));
    EXPECT_EQ(next(), "com.c");
    EXPECT_EQ(next(), "com.b");
}

TEST_F(TransferQueueTest, PrioritizingWhatIsUnderWayChangesNothing) {
    EXPECT_EQ(next(), "com.a");
    EXPECT_THAT(prioritize("com.a"), ElementsAre(""));
    EXPECT_EQ(next(), "com.b");
}

TEST_F(TransferQueueTest, PrioritizingWhatIsNotToBeSentIsToldOnceAsAnError) {
    EXPECT_THAT(prioritize("com.other"), ElementsAre("no transfer of com.other is still to come"));
    EXPECT_EQ(next(), "com.a");
    queue.finish();
    EXPECT_THAT(prioritize("com.a"), ElementsAre("no transfer of com.a is still to come"));
}

TEST_F(TransferQueueTest, PrioritizingNeedsNoCompletion) {
    queue.prioritizeAsset(*asset("com.b"), nullptr);
    EXPECT_EQ(next(), "com.b");
}

TEST_F(TransferQueueTest, ACancelledTransferIsKnownWhenItsTurnComes) {
    queue.cancelTransferForFailedAsset(*asset("com.b"));
    EXPECT_EQ(next(), "com.a");
    EXPECT_FALSE(queue.isCancelled());
    EXPECT_EQ(next(), "com.b");
    EXPECT_TRUE(queue.isCancelled());
    queue.finish();
    EXPECT_FALSE(queue.isCancelled());
}

TEST_F(TransferQueueTest, TheTransferUnderWayIsCancelledAtOnce) {
    EXPECT_EQ(next(), "com.a");
    queue.cancelTransferForFailedAsset(*asset("com.a"));
    EXPECT_TRUE(queue.isCancelled());
}

TEST_F(TransferQueueTest, ADismissedCancelIsForgotten) {
    queue.cancelTransferForFailedAsset(*asset("com.a"));
    EXPECT_EQ(next(), "com.a");
    queue.dismissCancel();
    EXPECT_FALSE(queue.isCancelled());
}

TEST_F(TransferQueueTest, CancellingWhatIsNotUnderWayIsNoFailure) {
    queue.cancelTransferForFailedAsset(*asset("com.other"));
    EXPECT_EQ(next(), "com.a");
    EXPECT_FALSE(queue.isCancelled());
}

// The device may cancel while it prepares what it is about to ask for.
TEST_F(TransferQueueTest, ACancelBeforeTheQueueIsFilledCounts) {
    TransferQueue fresh;
    fresh.cancelTransferForFailedAsset(*asset("com.a"));
    fresh.fill({asset("com.a")});
    EXPECT_NE(fresh.next(), nullptr);
    EXPECT_TRUE(fresh.isCancelled());
}

}  // namespace
}  // namespace appsync
