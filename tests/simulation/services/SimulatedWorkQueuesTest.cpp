#include <memory>

#include "tests/simulation/SimulationFixture.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::HasSubstr;

// What the contract of work queues promises is tested for every implementation; here stands what
// only the simulation does.
class SimulatedWorkQueuesTest : public SimulationFixture {
  protected:
    WorkQueues& queues_ = platform_.queues;
};

TEST_F(SimulatedWorkQueuesTest, LeavingMoreOftenThanEnteringIsAFailure) {
    const auto group = queues_.makeWaitGroup();
    EXPECT_EQ(failureOf([&] { group->leave(); }), "WaitGroup#1 was left more often than entered");
}

TEST_F(SimulatedWorkQueuesTest, LockingTwiceIsAFailure) {
    const auto lock = queues_.makeLock();
    lock->lock();
    EXPECT_THAT(failureOf([&] { lock->lock(); }), HasSubstr("Lock#1 is not recursive"));
    lock->unlock();
}

TEST_F(SimulatedWorkQueuesTest, UnlockingWhatSomebodyElseHoldsIsAFailure) {
    const auto lock = queues_.makeLock();
    EXPECT_THAT(failureOf([&] { lock->unlock(); }), HasSubstr("does not hold it"));
    queues_.runAfter(0ns, [&] { lock->lock(); });
    platform_.runUntilIdle();
    EXPECT_THAT(failureOf([&] { lock->unlock(); }), HasSubstr("does not hold it"));
}

TEST_F(SimulatedWorkQueuesTest, SyncFromATaskOfTheSameQueueIsAFailure) {
    const auto queue = queues_.makeSerialQueue("label");
    EXPECT_THAT(failureOf([&] { queue->sync([&] { queue->sync([] {}); }); }),
                HasSubstr("SerialQueue#1.sync was called from a task of the same queue"));
}

TEST_F(SimulatedWorkQueuesTest, AQueueThatMayRunNothingIsAFailure) {
    const auto queue = queues_.makeOperationQueue();
    EXPECT_THAT(failureOf([&] { queue->setMaximumConcurrentOperations(0); }),
                HasSubstr("would never run anything"));
}

TEST_F(SimulatedWorkQueuesTest, ADeadlockNamesBothSides) {
    const auto one = queues_.makeLock();
    const auto other = queues_.makeLock();
    one->lock();
    queues_.runAfter(1s, [&] {
        other->lock();
        one->lock();
    });
    platform_.advance(1s);
    const std::string failure = failureOf([&] { other->lock(); });
    EXPECT_THAT(failure, HasSubstr("host waits for Lock#2"));
    EXPECT_THAT(failure, HasSubstr("delayed work waits for Lock#1"));
}

TEST_F(SimulatedWorkQueuesTest, WhatATaskDoesWrongReachesTheHost) {
    const auto group = queues_.makeWaitGroup();
    queues_.runAfter(1s, [&] { group->leave(); });
    EXPECT_THAT(failureOf([&] { platform_.advance(1s); }), HasSubstr("WaitGroup#1 was left"));
}

TEST_F(SimulatedWorkQueuesTest, WaitsForSerialQueuesAreServedInOrder) {
    const auto queue = queues_.makeSerialQueue("label");
    const auto open = queues_.makeSemaphore(0);
    std::string trace;
    const auto operations = queues_.makeOperationQueue();
    operations->add([&] { queue->sync([&] { (void)open->wait(); }); });
    for (const char name : {'a', 'b', 'c'}) {
        operations->add([&, name] { queue->sync([&] { trace += name; }); });
    }
    platform_.runUntilIdle();
    EXPECT_EQ(trace, "");
    open->signal();
    platform_.runUntilIdle();
    EXPECT_EQ(trace, "abc");
}

TEST_F(SimulatedWorkQueuesTest, AnHourTakesNoTime) {
    int runs = 0;
    std::function<void()> again = [&] {
        if (++runs < 120) queues_.runAfter(30s, again);
    };
    queues_.runAfter(30s, again);
    platform_.advance(1h);
    EXPECT_EQ(runs, 120);
    EXPECT_EQ(platform_.now(), 1h);
}

TEST_F(SimulatedWorkQueuesTest, ObjectsAreNumberedInTheRecording) {
    (void)queues_.makeWaitGroup();
    (void)queues_.makeWaitGroup();
    (void)queues_.makeSerialQueue("label");
    EXPECT_THAT(platform_.calls(),
                ElementsAre("WorkQueues.makeWaitGroup() -> WaitGroup#1",
                            "WorkQueues.makeWaitGroup() -> WaitGroup#2",
                            "WorkQueues.makeSerialQueue(label) -> SerialQueue#1"));
}

/// Whether two increments without a lock lose one, for some seed of a hundred.
TEST(InterleavingTest, FindsALostUpdate) {
    int lost = 0;
    for (std::uint64_t seed = 0; seed < 100; ++seed) {
        SystemPropertyLists codec;
        SimulatedPlatform platform(codec, Scheduling::seeded(seed));
        int value = 0;
        {
            const auto operations = platform.queues.makeOperationQueue();
            for (int i = 0; i < 2; ++i) {
                operations->add([&] {
                    const int before = value;
                    platform.notifications.post("between");
                    value = before + 1;
                });
            }
        }
        if (value == 1) ++lost;
    }
    EXPECT_GT(lost, 0);
    EXPECT_LT(lost, 100);
}

}  // namespace
}  // namespace appsync
