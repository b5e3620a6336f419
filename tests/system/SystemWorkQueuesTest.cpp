#include "system/threads/SystemWorkQueues.h"

#include <atomic>
#include <chrono>
#include <future>
#include <latch>
#include <mutex>
#include <stdexcept>
#include <system_error>
#include <vector>

#include <gtest/gtest.h>

namespace appsync {
namespace {

using std::chrono_literals::operator""h;
using std::chrono_literals::operator""ms;
using std::chrono_literals::operator""ns;

/// Starts so many threads and no more.
ThreadStarter atMost(int count) {
    return [left = std::make_shared<std::atomic<int>>(count)](Task task) {
        if (--*left < 0) throw std::system_error(EAGAIN, std::generic_category());
        return std::thread(std::move(task));
    };
}

/// A list that several threads append to.
class Journal {
  public:
    void add(int entry) {
        const std::lock_guard guard(mutex_);
        entries_.push_back(entry);
    }
    [[nodiscard]] std::vector<int> entries() const {
        const std::lock_guard guard(mutex_);
        return entries_;
    }

  private:
    mutable std::mutex mutex_;
    std::vector<int> entries_;
};

/// The most that were inside at one time.
class Peak {
  public:
    void enter() {
        const int now = ++inside_;
        int seen = highest_;
        while (now > seen && !highest_.compare_exchange_weak(seen, now)) {
        }
    }
    void leave() { --inside_; }
    [[nodiscard]] int highest() const { return highest_; }

  private:
    std::atomic<int> inside_ = 0;
    std::atomic<int> highest_ = 0;
};

void runOnThreads(int count, const std::function<void()>& work) {
    std::vector<std::thread> threads;
    for (int i = 0; i < count; ++i) threads.emplace_back(work);
    for (std::thread& thread : threads) thread.join();
}

class SystemWorkQueuesTest : public ::testing::Test {
  protected:
    SystemWorkQueues queues_;
};

TEST_F(SystemWorkQueuesTest, ASerialQueueRunsTheTaskBeforeItReturns) {
    const auto queue = queues_.makeSerialQueue("label");
    bool ran = false;
    queue->sync([&] { ran = true; });
    EXPECT_TRUE(ran);
}

TEST_F(SystemWorkQueuesTest, ASerialQueueRunsOneTaskAtATime) {
    const auto queue = queues_.makeSerialQueue("label");
    int unguarded = 0;
    runOnThreads(8, [&] {
        for (int i = 0; i < 500; ++i) queue->sync([&] { ++unguarded; });
    });
    EXPECT_EQ(unguarded, 4000);
}

TEST_F(SystemWorkQueuesTest, SerialQueuesDoNotWaitForEachOther) {
    const auto outer = queues_.makeSerialQueue("outer");
    const auto inner = queues_.makeSerialQueue("inner");
    bool ran = false;
    outer->sync([&] { inner->sync([&] { ran = true; }); });
    EXPECT_TRUE(ran);
}

TEST_F(SystemWorkQueuesTest, ASerialQueueOutlivesATaskThatThrows) {
    const auto queue = queues_.makeSerialQueue("label");
    EXPECT_THROW(queue->sync([] { throw std::runtime_error("x"); }), std::runtime_error);
    bool ran = false;
    queue->sync([&] { ran = true; });
    EXPECT_TRUE(ran);
}

TEST_F(SystemWorkQueuesTest, ASerialQueueThatWouldWaitForItselfSaysSo) {
    ::testing::GTEST_FLAG(death_test_style) = "threadsafe";
    const auto queue = queues_.makeSerialQueue("com.example.queue");
    EXPECT_DEATH(queue->sync([&] { queue->sync([] {}); }), "com.example.queue waits");
}

TEST_F(SystemWorkQueuesTest, AnEmptyWaitGroupDoesNotWait) {
    const auto group = queues_.makeWaitGroup();
    group->wait();
    EXPECT_TRUE(group->waitFor(0ns));
}

TEST_F(SystemWorkQueuesTest, AWaitGroupWaitsUntilEveryEnterIsUndone) {
    const auto group = queues_.makeWaitGroup();
    std::atomic<int> left = 0;
    for (int i = 0; i < 4; ++i) group->enter();
    std::thread leaver([&] {
        for (int i = 0; i < 4; ++i) {
            ++left;
            group->leave();
        }
    });
    group->wait();
    EXPECT_EQ(left, 4);
    leaver.join();
}

TEST_F(SystemWorkQueuesTest, AWaitGroupGivesUpAfterTheTimeout) {
    const auto group = queues_.makeWaitGroup();
    group->enter();
    const auto start = std::chrono::steady_clock::now();
    EXPECT_FALSE(group->waitFor(5ms));
    EXPECT_GE(std::chrono::steady_clock::now() - start, 5ms);
    EXPECT_FALSE(group->waitFor(-5ms));
    group->leave();
    EXPECT_TRUE(group->waitFor(std::chrono::nanoseconds::max()));
}

TEST_F(SystemWorkQueuesTest, AWaitGroupThatIsLeftTooOftenSaysSo) {
    ::testing::GTEST_FLAG(death_test_style) = "threadsafe";
    const auto group = queues_.makeWaitGroup();
    EXPECT_DEATH(group->leave(), "left more often");
}

TEST_F(SystemWorkQueuesTest, ASemaphoreLetsThroughAsManyAsItsValueAndItsSignals) {
    const auto semaphore = queues_.makeSemaphore(1);
    EXPECT_TRUE(semaphore->wait());
    std::thread signaller([&] {
        semaphore->signal();
        semaphore->signal();
    });
    EXPECT_TRUE(semaphore->wait());
    EXPECT_TRUE(semaphore->wait());
    signaller.join();
}

TEST_F(SystemWorkQueuesTest, ALockExcludes) {
    const auto lock = queues_.makeLock();
    int unguarded = 0;
    runOnThreads(4, [&] {
        for (int i = 0; i < 500; ++i) {
            const std::lock_guard guard(*lock);
            ++unguarded;
        }
    });
    EXPECT_EQ(unguarded, 2000);
}

TEST_F(SystemWorkQueuesTest, AnOperationQueueRunsAsManyAtOnceAsItMay) {
    std::latch together(11);
    const auto queue = queues_.makeOperationQueue();
    queue->setMaximumConcurrentOperations(10);
    for (int i = 0; i < 10; ++i) queue->add([&] { together.arrive_and_wait(); });
    together.arrive_and_wait();
}

TEST_F(SystemWorkQueuesTest, AnOperationQueueRunsNoMoreAtOnceThanItMay) {
    Peak peak;
    std::atomic<int> ran = 0;
    {
        const auto queue = queues_.makeOperationQueue();
        queue->setMaximumConcurrentOperations(3);
        for (int i = 0; i < 300; ++i) {
            queue->add([&] {
                peak.enter();
                std::this_thread::yield();
                ++ran;
                peak.leave();
            });
        }
    }
    EXPECT_EQ(ran, 300);
    EXPECT_LE(peak.highest(), 3);
}

TEST_F(SystemWorkQueuesTest, OperationsStartInTheOrderOfSubmission) {
    Journal journal;
    {
        const auto queue = queues_.makeOperationQueue();
        queue->setMaximumConcurrentOperations(1);
        for (int i = 0; i < 50; ++i) queue->add([&, i] { journal.add(i); });
    }
    std::vector<int> expected(50);
    for (int i = 0; i < 50; ++i) expected[static_cast<std::size_t>(i)] = i;
    EXPECT_EQ(journal.entries(), expected);
}

TEST_F(SystemWorkQueuesTest, AMaximumOfZeroIsTakenForOne) {
    std::atomic<bool> ran = false;
    {
        const auto queue = queues_.makeOperationQueue();
        queue->setMaximumConcurrentOperations(0);
        queue->add([&] { ran = true; });
    }
    EXPECT_TRUE(ran);
}

TEST_F(SystemWorkQueuesTest, ARaisedMaximumStartsWhatWaits) {
    std::latch together(3);
    const auto queue = queues_.makeOperationQueue();
    queue->setMaximumConcurrentOperations(1);
    queue->add([&] { together.arrive_and_wait(); });
    queue->add([&] { together.arrive_and_wait(); });
    queue->setMaximumConcurrentOperations(2);
    together.arrive_and_wait();
}

TEST_F(SystemWorkQueuesTest, ALoweredMaximumHoldsForWhatIsStartedLater) {
    Peak peak;
    std::latch together(5);
    {
        const auto queue = queues_.makeOperationQueue();
        queue->setMaximumConcurrentOperations(4);
        for (int i = 0; i < 4; ++i) queue->add([&] { together.arrive_and_wait(); });
        together.arrive_and_wait();
        queue->setMaximumConcurrentOperations(1);
        // Those that waited together may still be ending: they count no more in the peak.
        for (int i = 0; i < 100; ++i) {
            queue->add([&] {
                peak.enter();
                std::this_thread::yield();
                peak.leave();
            });
        }
    }
    EXPECT_EQ(peak.highest(), 1);
}

TEST_F(SystemWorkQueuesTest, AnOperationMayAddAnother) {
    Journal journal;
    {
        const auto queue = queues_.makeOperationQueue();
        queue->setMaximumConcurrentOperations(1);
        queue->add([&] {
            queue->add([&] { journal.add(2); });
            journal.add(1);
        });
    }
    EXPECT_EQ(journal.entries(), (std::vector{1, 2}));
}

TEST(SystemWorkQueuesEndTest, AnOperationMayDestroyItsQueue) {
    std::atomic<int> ran = 0;
    std::promise<void> everythingIsAdded;
    {
        SystemWorkQueues queues;
        OperationQueue* queue = queues.makeOperationQueue().release();
        queue->setMaximumConcurrentOperations(2);
        queue->add([&, queue, future = everythingIsAdded.get_future().share()] {
            future.wait();
            delete queue;
            ++ran;
        });
        for (int i = 0; i < 20; ++i) queue->add([&] { ++ran; });
        everythingIsAdded.set_value();
    }
    EXPECT_EQ(ran, 21);
}

TEST(SystemWorkQueuesEndTest, WhatAnOperationHoldsMayDestroyItsQueue) {
    struct Owner {
        std::unique_ptr<OperationQueue> queue;
    };
    std::weak_ptr<Owner> observed;
    {
        SystemWorkQueues queues;
        auto owner = std::make_shared<Owner>();
        owner->queue = queues.makeOperationQueue();
        observed = owner;
        OperationQueue& queue = *owner->queue;
        std::promise<void> released;
        queue.add([owner, future = released.get_future().share()] { future.wait(); });
        owner.reset();
        released.set_value();
    }
    EXPECT_TRUE(observed.expired());
}

TEST(SystemWorkQueuesEndTest, WithoutThreadsOperationsRunWhereTheyAreAdded) {
    SystemWorkQueues queues(atMost(1));  // the one that keeps time
    const auto queue = queues.makeOperationQueue();
    Journal journal;
    queue->add([&] {
        queue->add([&] { journal.add(2); });
        journal.add(1);
    });
    EXPECT_EQ(journal.entries(), (std::vector{1, 2}));
}

TEST(SystemWorkQueuesEndTest, WithoutThreadsAnOperationMayDestroyItsQueue) {
    SystemWorkQueues queues(atMost(1));
    auto queue = queues.makeOperationQueue();
    bool ran = false;
    OperationQueue& added = *queue;
    added.add([&] {
        queue.reset();
        ran = true;
    });
    EXPECT_TRUE(ran);
}

TEST(SystemWorkQueuesEndTest, WithTooFewThreadsEveryOperationRuns) {
    SystemWorkQueues queues(atMost(2));
    std::atomic<int> ran = 0;
    {
        const auto queue = queues.makeOperationQueue();
        queue->setMaximumConcurrentOperations(10);
        for (int i = 0; i < 50; ++i) queue->add([&] { ++ran; });
    }
    EXPECT_EQ(ran, 50);
}

TEST(SystemWorkQueuesEndTest, WithoutAnyThreadThereAreNoQueues) {
    EXPECT_THROW(SystemWorkQueues(atMost(0)), std::system_error);
}

TEST(SystemWorkQueuesEndTest, DelayedWorkRunsAfterItsDelay) {
    std::promise<std::chrono::steady_clock::time_point> ran;
    SystemWorkQueues queues;
    const auto start = std::chrono::steady_clock::now();
    queues.runAfter(10ms, [&] { ran.set_value(std::chrono::steady_clock::now()); });
    EXPECT_GE(ran.get_future().get() - start, 10ms);
}

TEST(SystemWorkQueuesEndTest, DelayedWorkRunsOnAnotherThread) {
    std::promise<std::thread::id> ran;
    SystemWorkQueues queues;
    queues.runAfter(-1h, [&] { ran.set_value(std::this_thread::get_id()); });
    EXPECT_NE(ran.get_future().get(), std::this_thread::get_id());
}

TEST(SystemWorkQueuesEndTest, DelayedWorkThatBlocksDoesNotHoldUpTheNext) {
    std::latch together(3);
    SystemWorkQueues queues;
    queues.runAfter(0ns, [&] { together.arrive_and_wait(); });
    queues.runAfter(0ns, [&] { together.arrive_and_wait(); });
    together.arrive_and_wait();
}

TEST(SystemWorkQueuesEndTest, DelayedWorkComesInTheOrderOfItsTimes) {
    Journal journal;
    std::promise<void> over;
    SystemWorkQueues queues(atMost(1));  // so the tasks run on the thread that keeps time
    queues.runAfter(20ms, [&] { journal.add(3); });
    queues.runAfter(20ms, [&] { over.set_value(); });
    queues.runAfter(10ms, [&] { journal.add(2); });
    queues.runAfter(0ns, [&] { journal.add(1); });
    over.get_future().wait();
    EXPECT_EQ(journal.entries(), (std::vector{1, 2, 3}));
}

TEST(SystemWorkQueuesEndTest, DelayedWorkThatHasNotComeDueIsDropped) {
    std::atomic<bool> ran = false;
    const auto held = std::make_shared<int>();
    {
        SystemWorkQueues queues;
        queues.runAfter(1h, [&, held] { ran = true; });
        queues.runAfter(std::chrono::nanoseconds::max(), [&, held] { ran = true; });
        EXPECT_EQ(held.use_count(), 3);
    }
    EXPECT_FALSE(ran);
    EXPECT_EQ(held.use_count(), 1);
}

TEST(SystemWorkQueuesEndTest, DelayedWorkThatRunsIsWaitedFor) {
    std::atomic<bool> ended = false;
    std::promise<void> started;
    {
        SystemWorkQueues queues;
        queues.runAfter(0ns, [&] {
            started.set_value();
            for (int i = 0; i < 1000; ++i) std::this_thread::yield();
            ended = true;
        });
        started.get_future().wait();
    }
    EXPECT_TRUE(ended);
}

/// Adds delayed work when it dies.
class LateAdder {
  public:
    LateAdder(SystemWorkQueues& queues, Task task) : queues_(queues), task_(std::move(task)) {}
    LateAdder(const LateAdder&) = delete;
    LateAdder& operator=(const LateAdder&) = delete;
    ~LateAdder() { queues_.runAfter(0ns, task_); }

  private:
    SystemWorkQueues& queues_;
    Task task_;
};

TEST(SystemWorkQueuesEndTest, WhatDelayedWorkAddsAtTheEndIsDropped) {
    std::atomic<bool> ran = false;
    {
        SystemWorkQueues queues;
        queues.runAfter(1h, [adder = std::make_shared<LateAdder>(queues, [&] { ran = true; })] {});
    }
    EXPECT_FALSE(ran);
}

TEST(SystemWorkQueuesEndTest, DroppedWorkMayDestroyAnOperationQueue) {
    std::atomic<int> ran = 0;
    {
        SystemWorkQueues queues;
        const std::shared_ptr<OperationQueue> queue = queues.makeOperationQueue();
        for (int i = 0; i < 20; ++i) queue->add([&] { ++ran; });
        queues.runAfter(1h, [queue] {});
    }
    EXPECT_EQ(ran, 20);
}

}  // namespace
}  // namespace appsync
