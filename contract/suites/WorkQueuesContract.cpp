#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "contract/SystemContract.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

class WorkQueuesContract : public SystemContract {
  protected:
    WorkQueuesContract() : queues_(system_->queues()), lock_(queues_.makeLock()) {}

    void note(const std::string& text) {
        const std::lock_guard<Lock> held(*lock_);
        notes_.push_back(text);
    }

    WorkQueues& queues_;
    const std::unique_ptr<Lock> lock_;
    std::vector<std::string> notes_;  // protected by lock_
};

APPSYNC_CONTRACT_SUITE(WorkQueuesContract, systemPorts());

TEST_P(WorkQueuesContract, ASerialQueueRunsATaskBeforeSyncReturns) {
    checks("platform/WorkQueues.h", "Runs the task and returns when it is done.");
    const auto queue = queues_.makeSerialQueue("queue");
    queue->sync([&] { note("task"); });
    note("after");
    EXPECT_THAT(notes_, ElementsAre("task", "after"));
}

TEST_P(WorkQueuesContract, TasksOfOneSerialQueueNeverOverlap) {
    checks("platform/WorkQueues.h", "Runs its tasks one at a time, in the order of submission.");
    const auto serial = queues_.makeSerialQueue("queue");
    int unguarded = 0;
    {
        const auto operations = queues_.makeOperationQueue();
        operations->setMaximumConcurrentOperations(8);
        for (int i = 0; i < 200; ++i) {
            operations->add([&] {
                serial->sync([&] {
                    const int before = unguarded;
                    note("inside");
                    unguarded = before + 1;
                });
            });
        }
    }
    EXPECT_EQ(unguarded, 200);
}

TEST_P(WorkQueuesContract, ATaskOfOneSerialQueueMayUseAnother) {
    checks("platform/WorkQueues.h", "a task of another queue may call it.");
    const auto outer = queues_.makeSerialQueue("outer");
    const auto inner = queues_.makeSerialQueue("inner");
    outer->sync([&] { inner->sync([&] { note("innermost"); }); });
    EXPECT_THAT(notes_, ElementsAre("innermost"));
}

TEST_P(WorkQueuesContract, AnEmptyGroupLetsThroughAtOnce) {
    checks("platform/WorkQueues.h",
           "Returns when every enter has been undone. At once when there is none.");
    const auto group = queues_.makeWaitGroup();
    group->wait();
    EXPECT_TRUE(group->waitFor(0ns));
}

TEST_P(WorkQueuesContract, AGroupWaitsForEveryLeave) {
    checks("platform/WorkQueues.h", "Returns when every enter has been undone.");
    const auto group = queues_.makeWaitGroup();
    const auto operations = queues_.makeOperationQueue();
    for (int i = 0; i < 20; ++i) {
        group->enter();
        operations->add([&] {
            note("task");
            group->leave();
        });
    }
    group->wait();
    EXPECT_EQ(notes_.size(), 20U);
}

TEST_P(WorkQueuesContract, AGroupIsGoodForMoreThanOneWait) {
    checks("platform/WorkQueues.h", "Returns when every enter has been undone.");
    const auto group = queues_.makeWaitGroup();
    const auto operations = queues_.makeOperationQueue();
    for (int round = 0; round < 3; ++round) {
        group->enter();
        operations->add([&] { group->leave(); });
        group->wait();
        EXPECT_TRUE(group->waitFor(1h));
    }
}

TEST_P(WorkQueuesContract, AWaitForAGroupTimesOut) {
    checks("platform/WorkQueues.h", "The same, but for at most `timeout`. False when it ran out.");
    const auto group = queues_.makeWaitGroup();
    group->enter();
    const auto before = system_->now();
    EXPECT_FALSE(group->waitFor(2ms));
    EXPECT_GE(system_->now() - before, 2ms);
    group->leave();
    EXPECT_TRUE(group->waitFor(0ns));
}

TEST_P(WorkQueuesContract, AGroupWithinItsTimeoutIsNoTimeout) {
    checks("platform/WorkQueues.h", "The same, but for at most `timeout`. False when it ran out.");
    const auto group = queues_.makeWaitGroup();
    const auto operations = queues_.makeOperationQueue();
    const auto before = system_->now();
    group->enter();
    operations->add([&] { group->leave(); });
    EXPECT_TRUE(group->waitFor(1h) || system_->now() - before >= 1h);
}

TEST_P(WorkQueuesContract, ASemaphoreGivesAsManyTurnsAsItHas) {
    checks("platform/WorkQueues.h", "Waits without limit and takes one signal.");
    const auto semaphore = queues_.makeSemaphore(2);
    EXPECT_TRUE(semaphore->wait());
    EXPECT_TRUE(semaphore->wait());
    semaphore->signal();
    EXPECT_TRUE(semaphore->wait());
}

TEST_P(WorkQueuesContract, ASemaphoreOrdersWhatWasWrittenBeforeItsSignal) {
    checks("platform/WorkQueues.h",
           "What was written before a signal is seen by who has waited for it.");
    const auto semaphore = queues_.makeSemaphore(0);
    const auto operations = queues_.makeOperationQueue();
    std::string written;
    operations->add([&] {
        written = "written";
        semaphore->signal();
    });
    EXPECT_TRUE(semaphore->wait());
    EXPECT_EQ(written, "written");
}

TEST_P(WorkQueuesContract, ALockExcludesOthersAcrossCallsOfThePlatform) {
    checks(
        "platform/WorkQueues.h",
        "Mutual exclusion that may be held across calls of the platform (std::mutex may not be).");
    const auto lock = queues_.makeLock();
    int unguarded = 0;
    {
        const auto operations = queues_.makeOperationQueue();
        operations->setMaximumConcurrentOperations(8);
        for (int i = 0; i < 200; ++i) {
            operations->add([&] {
                const std::lock_guard<Lock> held(*lock);
                const int before = unguarded;
                note("inside");
                unguarded = before + 1;
            });
        }
    }
    EXPECT_EQ(unguarded, 200);
}

TEST_P(WorkQueuesContract, OperationsStartInTheOrderOfSubmission) {
    checks("platform/WorkQueues.h",
           "Runs tasks on threads of its own, a bounded number at a time, started in the order of "
           "submission.");
    {
        const auto operations = queues_.makeOperationQueue();
        operations->setMaximumConcurrentOperations(1);
        for (int i = 0; i < 5; ++i) operations->add([this, i] { note(std::to_string(i)); });
    }
    EXPECT_THAT(notes_, ElementsAre("0", "1", "2", "3", "4"));
}

TEST_P(WorkQueuesContract, NoMoreOperationsThanAllowedRunAtATime) {
    checks("platform/WorkQueues.h",
           "Runs tasks on threads of its own, a bounded number at a time, started in the order of "
           "submission.");
    std::size_t running = 0;
    std::size_t most = 0;
    const auto change = [&](std::size_t by) {
        const std::lock_guard<Lock> held(*lock_);
        running += by;
        most = std::max(most, running);
    };
    {
        const auto operations = queues_.makeOperationQueue();
        operations->setMaximumConcurrentOperations(3);
        for (int i = 0; i < 50; ++i) {
            operations->add([&] {
                change(1);
                note("running");
                change(std::size_t{0} - 1);
            });
        }
    }
    EXPECT_LE(most, 3U);
    EXPECT_EQ(notes_.size(), 50U);
}

TEST_P(WorkQueuesContract, AsManyOperationsAsAllowedMeetEachOther) {
    checks("platform/WorkQueues.h",
           "Runs tasks on threads of its own, a bounded number at a time, started in the order of "
           "submission.");
    constexpr int kCount = 10;
    const auto arrived = queues_.makeSemaphore(0);
    const auto open = queues_.makeSemaphore(0);
    const auto operations = queues_.makeOperationQueue();
    operations->setMaximumConcurrentOperations(kCount);
    for (int i = 0; i < kCount; ++i) {
        operations->add([&] {
            arrived->signal();
            EXPECT_TRUE(open->wait());
        });
    }
    for (int i = 0; i < kCount; ++i) EXPECT_TRUE(arrived->wait());
    for (int i = 0; i < kCount; ++i) open->signal();
}

TEST_P(WorkQueuesContract, AnOperationMayAddAnother) {
    checks("platform/WorkQueues.h", "A task may add others.");
    const auto group = queues_.makeWaitGroup();
    const auto operations = queues_.makeOperationQueue();
    operations->setMaximumConcurrentOperations(1);
    group->enter();
    operations->add([&] {
        operations->add([&] {
            note("second");
            group->leave();
        });
        note("first");
    });
    group->wait();
    EXPECT_THAT(notes_, ElementsAre("first", "second"));
}

TEST_P(WorkQueuesContract, DestroyingAnOperationQueueWaitsForItsOperations) {
    checks(
        "platform/WorkQueues.h",
        "Its destruction waits for the tasks that were submitted, unless one of them destroys it.");
    auto operations = queues_.makeOperationQueue();
    operations->setMaximumConcurrentOperations(2);
    for (int i = 0; i < 10; ++i) operations->add([&] { note("done"); });
    operations.reset();
    EXPECT_EQ(notes_.size(), 10U);
}

TEST_P(WorkQueuesContract, AnOperationMayDestroyItsQueue) {
    checks(
        "platform/WorkQueues.h",
        "Its destruction waits for the tasks that were submitted, unless one of them destroys it.");
    const auto group = queues_.makeWaitGroup();
    const auto ready = queues_.makeSemaphore(0);
    auto operations = queues_.makeOperationQueue();
    group->enter();
    operations->add([&] {
        EXPECT_TRUE(ready->wait());
        operations.reset();
        note("destroyed");
        group->leave();
    });
    ready->signal();
    group->wait();
    EXPECT_THAT(notes_, ElementsAre("destroyed"));
}

TEST_P(WorkQueuesContract, TheLastOwnerOfAQueueMayBeItsOwnOperation) {
    checks(
        "platform/WorkQueues.h",
        "Its destruction waits for the tasks that were submitted, unless one of them destroys it.");
    const auto group = queues_.makeWaitGroup();
    const auto ready = queues_.makeSemaphore(0);
    std::shared_ptr<OperationQueue> operations = queues_.makeOperationQueue();
    group->enter();
    operations->add([&, owned = operations] {
        EXPECT_TRUE(ready->wait());
        note("done");
        group->leave();
    });
    operations.reset();
    ready->signal();
    group->wait();
    EXPECT_THAT(notes_, ElementsAre("done"));
}

TEST_P(WorkQueuesContract, DelayedWorkDoesNotRunBeforeItsTime) {
    checks("platform/WorkQueues.h",
           "Runs the task on the global default-priority queue, once `delay` has passed.");
    const auto group = queues_.makeWaitGroup();
    const auto before = system_->now();
    std::chrono::nanoseconds after{0};
    group->enter();
    queues_.runAfter(3ms, [&] {
        after = system_->now();
        group->leave();
    });
    group->wait();
    EXPECT_GE(after - before, 3ms);
}

TEST_P(WorkQueuesContract, DelayedWorkMayScheduleMore) {
    checks("platform/WorkQueues.h",
           "Runs the task on the global default-priority queue, once `delay` has passed.");
    const auto group = queues_.makeWaitGroup();
    group->enter();
    queues_.runAfter(1ms, [&] {
        note("first");
        queues_.runAfter(1ms, [&] {
            note("second");
            group->leave();
        });
    });
    group->wait();
    EXPECT_THAT(notes_, ElementsAre("first", "second"));
}

TEST_P(WorkQueuesContract, WorkWithoutDelayRunsToo) {
    checks("platform/WorkQueues.h",
           "Runs the task on the global default-priority queue, once `delay` has passed.");
    const auto group = queues_.makeWaitGroup();
    group->enter();
    queues_.runAfter(0ns, [&] { group->leave(); });
    group->wait();
}

}  // namespace

void linkWorkQueuesContract() {}

}  // namespace appsync
