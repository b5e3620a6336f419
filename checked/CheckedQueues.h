#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <string_view>

#include "checked/BreachBook.h"
#include "platform/WorkQueues.h"

namespace appsync {

/// Looks at how queues run their tasks.
class CheckedWorkQueues final : public WorkQueues {
  public:
    /// The book is shared with tasks that come due later.
    CheckedWorkQueues(WorkQueues& queues, std::shared_ptr<BreachBook> book);

    [[nodiscard]] std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override;
    [[nodiscard]] std::unique_ptr<OperationQueue> makeOperationQueue() override;
    [[nodiscard]] std::unique_ptr<WaitGroup> makeWaitGroup() override;
    [[nodiscard]] std::unique_ptr<Semaphore> makeSemaphore(std::int64_t value) override;
    [[nodiscard]] std::unique_ptr<Lock> makeLock() override;
    void runAfter(std::chrono::nanoseconds delay, Task task) override;

  private:
    template <typename Made>
    std::unique_ptr<Made> present(std::unique_ptr<Made> made, std::string_view call);

    WorkQueues& queues_;
    const std::shared_ptr<BreachBook> book_;
};

}  // namespace appsync
