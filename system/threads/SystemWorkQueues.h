#pragma once

// system/threads: queues, groups and the clock on threads of this process, as any device on POSIX
// can use them, with ThreadedOperationQueue.h and DelayedWork.h. Includes platform/ alone.

#include <functional>
#include <memory>
#include <thread>

#include "platform/WorkQueues.h"

namespace appsync {

class DelayedWork;
class OperationQueueBook;

/// Starts a thread that runs the task. May throw std::system_error when there are no more threads.
using ThreadStarter = std::function<std::thread(Task)>;

/// Queues and their kin on threads of this process.
///
/// A serial queue runs each task on the thread that brings it. An operation queue starts threads as
/// tasks need them and keeps them; until told otherwise it runs as many at a time as there are
/// processors, and a maximum of 0 is taken for 1. When no thread at all can be started, tasks run
/// on the thread that adds them.
///
/// Delayed work runs on a few threads that all delayed work shares: keep it short. Time is
/// monotonic: setting the clock of the machine moves nothing.
///
/// Destruction drops the delayed work that has not come due, waits for that which has, and ends
/// every thread. It must not happen on one of these threads.
class SystemWorkQueues : public WorkQueues {
  public:
    SystemWorkQueues();
    /// With threads from elsewhere.
    explicit SystemWorkQueues(ThreadStarter startThread);
    SystemWorkQueues(const SystemWorkQueues&) = delete;
    SystemWorkQueues& operator=(const SystemWorkQueues&) = delete;
    ~SystemWorkQueues() override;

    [[nodiscard]] std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override;
    [[nodiscard]] std::unique_ptr<OperationQueue> makeOperationQueue() override;
    [[nodiscard]] std::unique_ptr<WaitGroup> makeWaitGroup() override;
    [[nodiscard]] std::unique_ptr<Semaphore> makeSemaphore(std::int64_t value) override;
    [[nodiscard]] std::unique_ptr<Lock> makeLock() override;
    void runAfter(std::chrono::nanoseconds delay, Task task) override;

  private:
    const ThreadStarter startThread_;
    const std::unique_ptr<OperationQueueBook> book_;  // outlives the delayed work
    std::unique_ptr<DelayedWork> delayed_;
};

}  // namespace appsync
