#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/WorkQueues.h"
#include "system/threads/ThreadedOperationQueue.h"

namespace appsync {

/// The moment on the monotonic clock that lies `delay` ahead; a delay beyond a century is a
/// century.
[[nodiscard]] std::chrono::steady_clock::time_point momentAfter(std::chrono::nanoseconds delay);

/// Tasks that wait for their time, and the threads that then run them. What comes due at one moment
/// is started in the order of submission. Callable on any thread.
class DelayedWork {
  public:
    /// Throws std::system_error when the one thread that it needs cannot be started.
    DelayedWork(const ThreadStarter& startThread, OperationQueueBook& book);
    DelayedWork(const DelayedWork&) = delete;
    DelayedWork& operator=(const DelayedWork&) = delete;
    ~DelayedWork() { stop(); }

    void runAfter(std::chrono::nanoseconds delay, Task task);

    /// Drops what has not come due, and waits for what has. Whatever is added from now on is
    /// dropped.
    void stop();

  private:
    struct Item {
        std::chrono::steady_clock::time_point due;
        std::uint64_t sequence = 0;
        Task task;
    };

    static bool comesLater(const Item& left, const Item& right);
    void keepTime();
    Task takeFirst();

    std::mutex mutex_;
    std::condition_variable changed_;
    // Protected by mutex_.
    std::vector<Item> items_;  // a heap; what comes first stands first
    std::uint64_t nextSequence_ = 0;
    bool isStopping_ = false;

    ThreadedOperationQueue workers_;
    std::thread timer_;
};

}  // namespace appsync
