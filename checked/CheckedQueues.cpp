#include "checked/CheckedQueues.h"

#include <atomic>
#include <string>
#include <utility>

namespace appsync {

namespace {

class CheckedSerialQueue final : public SerialQueue {
  public:
    CheckedSerialQueue(std::unique_ptr<SerialQueue> queue, std::shared_ptr<BreachBook> book)
        : queue_(std::move(queue)), book_(std::move(book)) {}

    void sync(const Task& task) override {
        std::atomic<bool> isDone{false};
        queue_->sync([&] {
            if (isRunning_.exchange(true)) {
                book_->broken("platform/WorkQueues.h",
                              "Runs its tasks one at a time, in the order of submission.",
                              "a serial queue began a task while another one ran");
            }
            task();
            isRunning_ = false;
            isDone = true;
        });
        if (isDone) return;
        book_->broken("platform/WorkQueues.h", "Runs the task and returns when it is done.",
                      "sync returned before the task was done");
    }

  private:
    const std::unique_ptr<SerialQueue> queue_;
    const std::shared_ptr<BreachBook> book_;
    std::atomic<bool> isRunning_{false};
};

/// How many tasks of a queue run, and how many may. Shared with the tasks.
struct Operations {
    std::atomic<std::size_t> running{0};
    std::atomic<std::size_t> maximum{0};  // 0: not said
};

class CheckedOperationQueue final : public OperationQueue {
  public:
    CheckedOperationQueue(std::unique_ptr<OperationQueue> queue, std::shared_ptr<BreachBook> book)
        : queue_(std::move(queue)), book_(std::move(book)) {}

    void add(Task task) override {
        queue_->add([operations = operations_, book = book_, task = std::move(task),
                     hasRun = std::make_shared<std::atomic<bool>>(false)]() mutable {
            const std::size_t running = ++operations->running;
            const std::size_t maximum = operations->maximum;
            if (maximum != 0 && running > maximum) {
                book->broken("platform/WorkQueues.h", "a bounded number at a time",
                             "an operation queue ran more tasks at a time than it was told to");
            }
            if (hasRun->exchange(true)) {
                book->broken("platform/WorkQueues.h", "Runs tasks on threads of its own",
                             "an operation queue ran a task twice");
            } else {
                task();
            }
            task = nullptr;
            --operations->running;
        });
    }
    void setMaximumConcurrentOperations(std::size_t count) override {
        // Those that run already may be more.
        operations_->maximum = operations_->running == 0 ? count : 0;
        queue_->setMaximumConcurrentOperations(count);
    }

  private:
    const std::shared_ptr<Operations> operations_ = std::make_shared<Operations>();
    const std::unique_ptr<OperationQueue> queue_;
    const std::shared_ptr<BreachBook> book_;
};

}  // namespace

CheckedWorkQueues::CheckedWorkQueues(WorkQueues& queues, std::shared_ptr<BreachBook> book)
    : queues_(queues), book_(std::move(book)) {}

template <typename Made>
std::unique_ptr<Made> CheckedWorkQueues::present(std::unique_ptr<Made> made,
                                                 std::string_view call) {
    if (made == nullptr) {
        book_->broken("platform/WorkQueues.h", "Makes queues and their kin, and runs delayed work.",
                      std::string(call) + " gave null");
    }
    return made;
}

std::unique_ptr<SerialQueue> CheckedWorkQueues::makeSerialQueue(std::string_view label) {
    auto queue = present(queues_.makeSerialQueue(label), "makeSerialQueue");
    if (queue == nullptr) return queue;
    return std::make_unique<CheckedSerialQueue>(std::move(queue), book_);
}

std::unique_ptr<OperationQueue> CheckedWorkQueues::makeOperationQueue() {
    auto queue = present(queues_.makeOperationQueue(), "makeOperationQueue");
    if (queue == nullptr) return queue;
    return std::make_unique<CheckedOperationQueue>(std::move(queue), book_);
}

std::unique_ptr<WaitGroup> CheckedWorkQueues::makeWaitGroup() {
    return present(queues_.makeWaitGroup(), "makeWaitGroup");
}

std::unique_ptr<Semaphore> CheckedWorkQueues::makeSemaphore(std::int64_t value) {
    return present(queues_.makeSemaphore(value), "makeSemaphore");
}

std::unique_ptr<Lock> CheckedWorkQueues::makeLock() {
    return present(queues_.makeLock(), "makeLock");
}

void CheckedWorkQueues::runAfter(std::chrono::nanoseconds delay, Task task) {
    queues_.runAfter(delay, std::move(task));
}

}  // namespace appsync
