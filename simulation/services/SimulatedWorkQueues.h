#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <string_view>

#include "platform/WorkQueues.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

/// Queues, groups, semaphores and locks whose tasks are those of the simulation's scheduler.
///
/// Enforces what the contract forbids with a SimulationFailure: leaving a group more often than it
/// was entered, locking a lock twice, unlocking somebody else's, `sync` from a task of the same
/// queue. In the recording each object has a number: "WaitGroup#1.enter()".
class SimulatedWorkQueues : public WorkQueues {
  public:
    explicit SimulatedWorkQueues(Recorder& recorder) : recorder_(recorder) {}

    [[nodiscard]] std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override;
    [[nodiscard]] std::unique_ptr<OperationQueue> makeOperationQueue() override;
    [[nodiscard]] std::unique_ptr<WaitGroup> makeWaitGroup() override;
    [[nodiscard]] std::unique_ptr<Semaphore> makeSemaphore(std::int64_t value) override;
    [[nodiscard]] std::unique_ptr<Lock> makeLock() override;
    void runAfter(std::chrono::nanoseconds delay, Task task) override;

  private:
    Recorder& recorder_;
    std::size_t serialQueues_ = 0;
    std::size_t operationQueues_ = 0;
    std::size_t waitGroups_ = 0;
    std::size_t semaphores_ = 0;
    std::size_t locks_ = 0;
};

}  // namespace appsync
