#pragma once

#include <condition_variable>
#include <cstddef>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/WorkQueues.h"
#include "system/threads/SystemWorkQueues.h"

namespace appsync {

/// Knows which operation queues there are, and takes the threads of those that one of their own
/// tasks destroyed: these could not be joined there. Callable on any thread.
class OperationQueueBook {
  public:
    OperationQueueBook() = default;
    OperationQueueBook(const OperationQueueBook&) = delete;
    OperationQueueBook& operator=(const OperationQueueBook&) = delete;

    void opened();
    /// A queue has ended; `threads` may still be at work.
    void closed(std::vector<std::thread> threads);
    /// Returns when every queue has ended and all of those threads too. Not on one of them.
    void waitForAll();

  private:
    std::mutex mutex_;
    std::condition_variable changed_;
    // Protected by mutex_.
    std::size_t open_ = 0;
    std::vector<std::thread> threads_;
};

/// An operation queue on threads that are started as tasks need them.
class ThreadedOperationQueue : public OperationQueue {
  public:
    /// `book` must outlive the queue and its threads.
    ThreadedOperationQueue(ThreadStarter startThread, OperationQueueBook& book,
                           std::size_t maximum);
    ThreadedOperationQueue(const ThreadedOperationQueue&) = delete;
    ThreadedOperationQueue& operator=(const ThreadedOperationQueue&) = delete;
    ~ThreadedOperationQueue() override;

    void add(Task task) override;
    void setMaximumConcurrentOperations(std::size_t count) override;

    /// What destruction does: waits for the tasks that were submitted, unless one of them asks.
    /// Only its own tasks may add more from now on. By one thread at a time; again changes nothing.
    void finish();

  private:
    class State;

    // Shared with the threads: a task may destroy the queue while its thread goes on.
    const std::shared_ptr<State> state_;
    OperationQueueBook& book_;
    bool isFinished_ = false;
};

}  // namespace appsync
