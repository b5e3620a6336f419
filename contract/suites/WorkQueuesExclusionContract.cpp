#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "contract/Sentence.h"
#include "contract/SystemContract.h"

namespace appsync {

void linkWorkQueuesExclusionContract() {}

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

class WorkQueuesExclusionContract : public SystemContract {
  protected:
    void note(const std::string& text) {
        const std::lock_guard held(mutex_);
        notes_.push_back(text);
    }
    /// Lets everybody else go on until they wait for something.
    void letOthersRun() {
        const auto nobody = queues_.makeWaitGroup();
        nobody->enter();
        EXPECT_FALSE(nobody->waitFor(20ms));
        nobody->leave();
    }

    WorkQueues& queues_ = system_->queues();
    std::mutex mutex_;
    std::vector<std::string> notes_;  // protected by mutex_
};

APPSYNC_CONTRACT_SUITE(WorkQueuesExclusionContract, systemPorts());

TEST_P(WorkQueuesExclusionContract, ALockIsHeldWhileItsHolderWaits) {
    checks("platform/WorkQueues.h",
           "Mutual exclusion that may be held across calls of the platform");
    const auto lock = queues_.makeLock();
    const auto held = queues_.makeSemaphore(0);
    const auto operations = queues_.makeOperationQueue();
    operations->setMaximumConcurrentOperations(2);
    const auto over = queues_.makeWaitGroup();
    over->enter();
    operations->add([&] {
        EXPECT_TRUE(held->wait());
        const std::lock_guard<Lock> guard(*lock);
        note("second");
        over->leave();
    });
    {
        const std::lock_guard<Lock> guard(*lock);
        held->signal();
        letOthersRun();
        note("first");
    }
    over->wait();
    EXPECT_THAT(notes_, ElementsAre("first", "second"));
}

TEST_P(WorkQueuesExclusionContract, ASerialTaskIsAloneWhileItWaits) {
    checks("platform/WorkQueues.h", "Runs its tasks one at a time, in the order of submission.");
    const auto queue = queues_.makeSerialQueue("queue");
    const auto begun = queues_.makeSemaphore(0);
    const auto over = queues_.makeWaitGroup();
    const auto operations = queues_.makeOperationQueue();
    over->enter();
    operations->add([&] {
        EXPECT_TRUE(begun->wait());
        queue->sync([&] { note("second"); });
        over->leave();
    });
    queue->sync([&] {
        begun->signal();
        letOthersRun();
        note("first");
    });
    over->wait();
    EXPECT_THAT(notes_, ElementsAre("first", "second"));
}

TEST_P(WorkQueuesExclusionContract, ASemaphoreGivesNoMoreTurnsThanItHas) {
    checks("platform/WorkQueues.h", "Waits without limit and takes one signal.");
    const auto semaphore = queues_.makeSemaphore(1);
    EXPECT_TRUE(semaphore->wait());
    const auto over = queues_.makeWaitGroup();
    const auto operations = queues_.makeOperationQueue();
    over->enter();
    operations->add([&] {
        EXPECT_TRUE(semaphore->wait());
        note("taken");
        over->leave();
    });
    letOthersRun();
    note("given");
    semaphore->signal();
    over->wait();
    EXPECT_THAT(notes_, ElementsAre("given", "taken"));
}

TEST_P(WorkQueuesExclusionContract, AGroupWaitsInEachRound) {
    checks("platform/WorkQueues.h", "Returns when every enter has been undone.");
    const auto group = queues_.makeWaitGroup();
    const auto operations = queues_.makeOperationQueue();
    for (const char* round : {"first", "second"}) {
        group->enter();
        operations->add([&, round] {
            letOthersRun();
            note(round);
            group->leave();
        });
        group->wait();
        note("waited");
    }
    EXPECT_THAT(notes_, ElementsAre("first", "waited", "second", "waited"));
}

// The task needs the lock that its caller holds: it would wait for itself.
TEST_P(WorkQueuesExclusionContract, WorkWithoutDelayIsNotRunByItsCaller) {
    checks("platform/WorkQueues.h",
           "Runs the task on the global default-priority queue, once `delay` has passed.");
    const auto lock = queues_.makeLock();
    const auto over = queues_.makeWaitGroup();
    over->enter();
    {
        const std::lock_guard<Lock> guard(*lock);
        queues_.runAfter(0ns, [&] {
            {
                const std::lock_guard<Lock> inner(*lock);
                note("task");
            }
            over->leave();
        });
        note("returned");
    }
    over->wait();
    EXPECT_THAT(notes_, ElementsAre("returned", "task"));
}

TEST_P(WorkQueuesExclusionContract, AnOperationIsNotRunByItsCaller) {
    checks("platform/WorkQueues.h",
           "Runs tasks on threads of its own, a bounded number at a time, started in the order of "
           "submission.");
    const auto lock = queues_.makeLock();
    const auto over = queues_.makeWaitGroup();
    const auto operations = queues_.makeOperationQueue();
    over->enter();
    {
        const std::lock_guard<Lock> guard(*lock);
        operations->add([&] {
            {
                const std::lock_guard<Lock> inner(*lock);
                note("task");
            }
            over->leave();
        });
        note("returned");
    }
    over->wait();
    EXPECT_THAT(notes_, ElementsAre("returned", "task"));
}

}  // namespace
}  // namespace appsync
