#pragma once

#include <chrono>
#include <memory>
#include <string_view>

#include "platform/WorkQueues.h"

namespace appsync {

class Recording;

/// Queues whose use is recorded: which item was queued where, and when it begins and ends. What
/// lets others go on is written before it does, and what waits for others when it has.
class RecordedQueues : public WorkQueues {
  public:
    RecordedQueues(WorkQueues& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override;
    std::unique_ptr<OperationQueue> makeOperationQueue() override;
    std::unique_ptr<WaitGroup> makeWaitGroup() override;
    std::unique_ptr<Semaphore> makeSemaphore(std::int64_t value) override;
    std::unique_ptr<Lock> makeLock() override;
    void runAfter(std::chrono::nanoseconds delay, Task task) override;

  private:
    WorkQueues& inner_;
    Recording& recording_;
};

}  // namespace appsync
