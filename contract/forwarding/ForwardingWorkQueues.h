#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>
#include <utility>

#include "platform/WorkQueues.h"

namespace appsync {

/// A queue or one of its kin whose calls go to another, which it owns. For wrappers that change or
/// watch some of the calls.
class ForwardingSerialQueue : public SerialQueue {
  public:
    explicit ForwardingSerialQueue(std::unique_ptr<SerialQueue> target)
        : target_(std::move(target)) {}
    void sync(const Task& task) override { target_->sync(task); }

  protected:
    const std::unique_ptr<SerialQueue> target_;
};

class ForwardingWaitGroup : public WaitGroup {
  public:
    explicit ForwardingWaitGroup(std::unique_ptr<WaitGroup> target) : target_(std::move(target)) {}
    void enter() override { target_->enter(); }
    void leave() override { target_->leave(); }
    void wait() override { target_->wait(); }
    [[nodiscard]] bool waitFor(std::chrono::nanoseconds timeout) override {
        return target_->waitFor(timeout);
    }

  protected:
    const std::unique_ptr<WaitGroup> target_;
};

class ForwardingSemaphore : public Semaphore {
  public:
    explicit ForwardingSemaphore(std::unique_ptr<Semaphore> target) : target_(std::move(target)) {}
    void signal() override { target_->signal(); }
    [[nodiscard]] bool wait() override { return target_->wait(); }

  protected:
    const std::unique_ptr<Semaphore> target_;
};

class ForwardingOperationQueue : public OperationQueue {
  public:
    explicit ForwardingOperationQueue(std::unique_ptr<OperationQueue> target)
        : target_(std::move(target)) {}
    void add(Task task) override { target_->add(std::move(task)); }
    void setMaximumConcurrentOperations(std::size_t count) override {
        target_->setMaximumConcurrentOperations(count);
    }

  protected:
    std::unique_ptr<OperationQueue> target_;
};

/// Queues that another service makes. The target is borrowed.
class ForwardingWorkQueues : public WorkQueues {
  public:
    using Service = WorkQueues;

    explicit ForwardingWorkQueues(WorkQueues& target) : target_(target) {}

    [[nodiscard]] std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override {
        return target_.makeSerialQueue(label);
    }
    [[nodiscard]] std::unique_ptr<OperationQueue> makeOperationQueue() override {
        return target_.makeOperationQueue();
    }
    [[nodiscard]] std::unique_ptr<WaitGroup> makeWaitGroup() override {
        return target_.makeWaitGroup();
    }
    [[nodiscard]] std::unique_ptr<Semaphore> makeSemaphore(std::int64_t value) override {
        return target_.makeSemaphore(value);
    }
    [[nodiscard]] std::unique_ptr<Lock> makeLock() override { return target_.makeLock(); }
    void runAfter(std::chrono::nanoseconds delay, Task task) override {
        target_.runAfter(delay, std::move(task));
    }

  protected:
    [[nodiscard]] WorkQueues& target() { return target_; }

  private:
    WorkQueues& target_;
};

}  // namespace appsync
