#pragma once

#include <chrono>
#include <memory>
#include <string_view>

#include "platform/WorkQueues.h"

namespace appsync {

class ReplayRun;

/// Queues of a replay: what runs when is said by the recording.
class ReplayQueues : public WorkQueues {
  public:
    explicit ReplayQueues(ReplayRun& run) : run_(run) {}

    std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override;
    std::unique_ptr<OperationQueue> makeOperationQueue() override;
    std::unique_ptr<WaitGroup> makeWaitGroup() override;
    std::unique_ptr<Semaphore> makeSemaphore(std::int64_t value) override;
    std::unique_ptr<Lock> makeLock() override;
    void runAfter(std::chrono::nanoseconds delay, Task task) override;

  private:
    ReplayRun& run_;
};

}  // namespace appsync
