#include "system/threads/SystemWorkQueues.h"

#include <algorithm>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <string>
#include <utility>

#include "system/threads/DelayedWork.h"
#include "system/threads/ThreadedOperationQueue.h"

namespace appsync {

namespace {

/// Going on would wait for ever or count wrongly for ever.
[[noreturn]] void stopOnMisuse(const std::string& what) {
    std::fprintf(stderr, "appsync: %s\n", what.c_str());
    std::abort();
}

/// Hands out turns in the order in which they are asked for.
class TurnTakingQueue : public SerialQueue {
  public:
    explicit TurnTakingQueue(std::string_view label) : label_(label) {}

    void sync(const Task& task) override {
        const Turn turn(*this);
        task();
    }

  private:
    class Turn {
      public:
        explicit Turn(TurnTakingQueue& queue) : queue_(queue) { queue_.begin(); }
        Turn(const Turn&) = delete;
        Turn& operator=(const Turn&) = delete;
        ~Turn() { queue_.end(); }

      private:
        TurnTakingQueue& queue_;
    };

    void begin() {
        std::unique_lock lock(mutex_);
        if (runner_ == std::this_thread::get_id()) {
            stopOnMisuse("a task of the serial queue " + label_ + " waits for that queue");
        }
        const std::uint64_t turn = nextTurn_++;
        changed_.wait(lock, [&] { return currentTurn_ == turn; });
        runner_ = std::this_thread::get_id();
    }

    void end() {
        const std::lock_guard guard(mutex_);
        runner_ = {};
        ++currentTurn_;
        changed_.notify_all();
    }

    const std::string label_;
    std::mutex mutex_;
    std::condition_variable changed_;
    // State below is protected by mutex_.
    std::uint64_t nextTurn_ = 0;
    std::uint64_t currentTurn_ = 0;
    std::thread::id runner_;
};

class CountingWaitGroup : public WaitGroup {
  public:
    void enter() override {
        const std::lock_guard guard(mutex_);
        ++count_;
    }

    // The waiter may destroy the group at once, so it is woken before the mutex is free again.
    void leave() override {
        const std::lock_guard guard(mutex_);
        if (count_ == 0) stopOnMisuse("a wait group was left more often than it was entered");
        if (--count_ == 0) empty_.notify_all();
    }

    void wait() override {
        std::unique_lock lock(mutex_);
        empty_.wait(lock, [this] { return count_ == 0; });
    }

    bool waitFor(std::chrono::nanoseconds timeout) override {
        std::unique_lock lock(mutex_);
        return empty_.wait_until(lock, momentAfter(timeout), [this] { return count_ == 0; });
    }

  private:
    std::mutex mutex_;
    std::condition_variable empty_;
    std::uint64_t count_ = 0;  // protected by mutex_
};

class CountingSemaphore : public Semaphore {
  public:
    explicit CountingSemaphore(std::int64_t value) : value_(value) {}

    // Woken before the mutex is free again, for the same reason as above.
    void signal() override {
        const std::lock_guard guard(mutex_);
        ++value_;
        signalled_.notify_one();
    }

    bool wait() override {
        std::unique_lock lock(mutex_);
        signalled_.wait(lock, [this] { return value_ > 0; });
        --value_;
        return true;
    }

  private:
    std::mutex mutex_;
    std::condition_variable signalled_;
    std::int64_t value_;  // protected by mutex_
};

class MutexLock : public Lock {
  public:
    void lock() override { mutex_.lock(); }
    void unlock() override { mutex_.unlock(); }

  private:
    std::mutex mutex_;
};

std::thread startStandardThread(Task task) { return std::thread(std::move(task)); }

}  // namespace

SystemWorkQueues::SystemWorkQueues() : SystemWorkQueues(startStandardThread) {}

SystemWorkQueues::SystemWorkQueues(ThreadStarter startThread)
    : startThread_(std::move(startThread)),
      book_(std::make_unique<OperationQueueBook>()),
      delayed_(std::make_unique<DelayedWork>(startThread_, *book_)) {}

SystemWorkQueues::~SystemWorkQueues() {
    // Both may run tasks that come back to this object, so its members are all there still.
    delayed_->stop();
    book_->waitForAll();
}

std::unique_ptr<SerialQueue> SystemWorkQueues::makeSerialQueue(std::string_view label) {
    return std::make_unique<TurnTakingQueue>(label);
}

std::unique_ptr<OperationQueue> SystemWorkQueues::makeOperationQueue() {
    return std::make_unique<ThreadedOperationQueue>(startThread_, *book_,
                                                    std::thread::hardware_concurrency());
}

std::unique_ptr<WaitGroup> SystemWorkQueues::makeWaitGroup() {
    return std::make_unique<CountingWaitGroup>();
}

std::unique_ptr<Semaphore> SystemWorkQueues::makeSemaphore(std::int64_t value) {
    return std::make_unique<CountingSemaphore>(value);
}

std::unique_ptr<Lock> SystemWorkQueues::makeLock() { return std::make_unique<MutexLock>(); }

void SystemWorkQueues::runAfter(std::chrono::nanoseconds delay, Task task) {
    delayed_->runAfter(delay, std::move(task));
}

}  // namespace appsync
