#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

namespace appsync {

using Task = std::function<void()>;

/// Runs its tasks one at a time, in the order of submission.
class SerialQueue {
  public:
    virtual ~SerialQueue() = default;
    /// Runs the task and returns when it is done. Never call it from a task of the same queue; a
    /// task of another queue may call it.
    virtual void sync(const Task& task) = 0;
};

/// Counts work in flight.
class WaitGroup {
  public:
    virtual ~WaitGroup() = default;
    virtual void enter() = 0;
    /// Undoes one enter. Once more than entered is a programming error.
    virtual void leave() = 0;
    /// Returns when every enter has been undone. At once when there is none.
    virtual void wait() = 0;
    /// The same, but for at most `timeout`. False when it ran out.
    [[nodiscard]] virtual bool waitFor(std::chrono::nanoseconds timeout) = 0;
};

/// A counting semaphore. What was written before a signal is seen by who has waited for it.
class Semaphore {
  public:
    virtual ~Semaphore() = default;
    virtual void signal() = 0;
    /// Waits without limit and takes one signal. False when the wait timed out, which without a
    /// limit it never does.
    [[nodiscard]] virtual bool wait() = 0;
};

/// Mutual exclusion that may be held across calls of the platform (std::mutex may not be). Not
/// recursive. Meets the requirements of BasicLockable.
class Lock {
  public:
    virtual ~Lock() = default;
    virtual void lock() = 0;
    virtual void unlock() = 0;
};

/// Runs tasks on threads of its own, a bounded number at a time, started in the order of
/// submission. Its destruction waits for the tasks that were submitted, unless one of them destroys
/// it. A task may add others.
class OperationQueue {
  public:
    virtual ~OperationQueue() = default;
    virtual void add(Task task) = 0;
    virtual void setMaximumConcurrentOperations(std::size_t count) = 0;
};

/// Makes queues and their kin, and runs delayed work. Callable on any thread. Everything that it
/// makes belongs to the caller and must not outlive it.
class WorkQueues {
  public:
    virtual ~WorkQueues() = default;

    [[nodiscard]] virtual std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) = 0;
    [[nodiscard]] virtual std::unique_ptr<OperationQueue> makeOperationQueue() = 0;
    [[nodiscard]] virtual std::unique_ptr<WaitGroup> makeWaitGroup() = 0;
    [[nodiscard]] virtual std::unique_ptr<Semaphore> makeSemaphore(std::int64_t value) = 0;
    [[nodiscard]] virtual std::unique_ptr<Lock> makeLock() = 0;

    /// Runs the task on the global default-priority queue, once `delay` has passed.
    virtual void runAfter(std::chrono::nanoseconds delay, Task task) = 0;
};

}  // namespace appsync
