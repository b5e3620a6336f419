#include "simulation/services/SimulatedWorkQueues.h"

#include <algorithm>
#include <deque>
#include <functional>
#include <limits>
#include <set>
#include <string>
#include <utility>

#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {

std::string numbered(std::string_view kind, std::size_t number) {
    return std::string(kind) + "#" + std::to_string(number);
}

class SimulatedSerialQueue : public SerialQueue {
  public:
    SimulatedSerialQueue(Recorder& recorder, std::string name)
        : recorder_(recorder), name_(std::move(name)) {}

    void sync(const Task& task) override {
        Scheduler& scheduler = recorder_.scheduler();
        if (runner_ == scheduler.current()) {
            throw SimulationFailure(name_ + ".sync was called from a task of the same queue");
        }
        const RecordedCall call(recorder_, name_, "sync");
        const std::size_t ticket = nextTicket_++;
        scheduler.wait(name_, [this, ticket] { return serving_ == ticket; });
        runner_ = scheduler.current();
        task();
        runner_ = nullptr;
        ++serving_;
    }

  private:
    Recorder& recorder_;
    const std::string name_;
    std::size_t nextTicket_ = 0;
    std::size_t serving_ = 0;
    const void* runner_ = nullptr;
};

class SimulatedWaitGroup : public WaitGroup {
  public:
    SimulatedWaitGroup(Recorder& recorder, std::string name)
        : recorder_(recorder), name_(std::move(name)) {}

    void enter() override {
        const RecordedCall call(recorder_, name_, "enter");
        ++entered_;
    }

    void leave() override {
        const RecordedCall call(recorder_, name_, "leave");
        if (entered_ == 0) throw SimulationFailure(name_ + " was left more often than entered");
        --entered_;
    }

    void wait() override {
        const RecordedCall call(recorder_, name_, "wait");
        recorder_.scheduler().wait(name_, [this] { return entered_ == 0; });
    }

    [[nodiscard]] bool waitFor(std::chrono::nanoseconds timeout) override {
        using std::chrono::duration_cast;
        const auto milliseconds = duration_cast<std::chrono::milliseconds>(timeout).count();
        RecordedCall call(recorder_, name_, "waitFor", std::to_string(milliseconds) + " ms");
        return call.result(
            recorder_.scheduler().waitFor(name_, timeout, [this] { return entered_ == 0; }));
    }

  private:
    Recorder& recorder_;
    const std::string name_;
    std::size_t entered_ = 0;
};

class SimulatedSemaphore : public Semaphore {
  public:
    SimulatedSemaphore(Recorder& recorder, std::string name, std::int64_t value)
        : recorder_(recorder), name_(std::move(name)), value_(value) {}

    void signal() override {
        const RecordedCall call(recorder_, name_, "signal");
        ++value_;
    }

    [[nodiscard]] bool wait() override {
        RecordedCall call(recorder_, name_, "wait");
        recorder_.scheduler().wait(name_, [this] { return value_ > 0; });
        --value_;
        return call.result(true);
    }

  private:
    Recorder& recorder_;
    const std::string name_;
    std::int64_t value_;
};

class SimulatedLock : public Lock {
  public:
    SimulatedLock(Recorder& recorder, std::string name)
        : recorder_(recorder), name_(std::move(name)) {}

    void lock() override {
        const void* self = recorder_.scheduler().current();
        if (holder_ == self)
            throw SimulationFailure(name_ + " is not recursive, and was locked twice");
        const RecordedCall call(recorder_, name_, "lock");
        recorder_.scheduler().wait(name_, [this] { return holder_ == nullptr; });
        holder_ = self;
    }

    void unlock() override {
        if (holder_ != recorder_.scheduler().current()) {
            throw SimulationFailure(name_ + " was unlocked by somebody who does not hold it");
        }
        const RecordedCall call(recorder_, name_, "unlock");
        holder_ = nullptr;
    }

  private:
    Recorder& recorder_;
    const std::string name_;
    const void* holder_ = nullptr;
};

/// The part of an operation queue that its running operations share with it.
struct OperationState : std::enable_shared_from_this<OperationState> {
    OperationState(Scheduler& owner, std::string queueName)
        : scheduler(owner), name(std::move(queueName)) {}

    [[nodiscard]] bool isIdle() const { return pending.empty() && running.empty(); }

    void startPending() {
        while (!pending.empty() && started < maximum) {
            ++started;
            auto run = [self = shared_from_this(), task = std::move(pending.front())]() mutable {
                self->run(std::move(task));
            };
            pending.pop_front();
            scheduler.spawn("operation " + std::to_string(++operations), std::move(run));
        }
    }

    void run(Task task) {
        running.insert(scheduler.current());
        task();
        task = nullptr;  // it may own whoever owns the queue
        running.erase(scheduler.current());
        --started;
        startPending();
    }

    Scheduler& scheduler;
    const std::string name;
    std::size_t maximum = std::numeric_limits<std::size_t>::max();
    std::size_t started = 0;
    std::size_t operations = 0;
    std::deque<Task> pending;
    std::set<const void*> running;
};

class SimulatedOperationQueue : public OperationQueue {
  public:
    SimulatedOperationQueue(Recorder& recorder, std::string name)
        : recorder_(recorder),
          state_(std::make_shared<OperationState>(recorder.scheduler(), std::move(name))) {}

    ~SimulatedOperationQueue() override {
        const std::shared_ptr<OperationState> state = state_;
        if (state->running.count(state->scheduler.current()) != 0) return;
        if (state->started == 0) return;
        state->scheduler.wait(state->name + " to be empty",
                              [&state] { return state->started == 0 && state->isIdle(); });
    }

    void add(Task task) override {
        const RecordedCall call(recorder_, state_->name, "add");
        state_->pending.push_back(std::move(task));
        state_->startPending();
    }

    void setMaximumConcurrentOperations(std::size_t count) override {
        const RecordedCall call(recorder_, state_->name, "setMaximumConcurrentOperations", count);
        if (count == 0) throw SimulationFailure(state_->name + " would never run anything");
        state_->maximum = count;
        state_->startPending();
    }

  private:
    Recorder& recorder_;
    std::shared_ptr<OperationState> state_;
};

}  // namespace

std::unique_ptr<SerialQueue> SimulatedWorkQueues::makeSerialQueue(std::string_view label) {
    const std::string name = numbered("SerialQueue", ++serialQueues_);
    RecordedCall call(recorder_, "WorkQueues", "makeSerialQueue", label);
    return call.result(std::make_unique<SimulatedSerialQueue>(recorder_, name), name);
}

std::unique_ptr<OperationQueue> SimulatedWorkQueues::makeOperationQueue() {
    const std::string name = numbered("OperationQueue", ++operationQueues_);
    RecordedCall call(recorder_, "WorkQueues", "makeOperationQueue");
    return call.result(std::make_unique<SimulatedOperationQueue>(recorder_, name), name);
}

std::unique_ptr<WaitGroup> SimulatedWorkQueues::makeWaitGroup() {
    const std::string name = numbered("WaitGroup", ++waitGroups_);
    RecordedCall call(recorder_, "WorkQueues", "makeWaitGroup");
    return call.result(std::make_unique<SimulatedWaitGroup>(recorder_, name), name);
}

std::unique_ptr<Semaphore> SimulatedWorkQueues::makeSemaphore(std::int64_t value) {
    const std::string name = numbered("Semaphore", ++semaphores_);
    RecordedCall call(recorder_, "WorkQueues", "makeSemaphore", value);
    return call.result(std::make_unique<SimulatedSemaphore>(recorder_, name, value), name);
}

std::unique_ptr<Lock> SimulatedWorkQueues::makeLock() {
    const std::string name = numbered("Lock", ++locks_);
    RecordedCall call(recorder_, "WorkQueues", "makeLock");
    return call.result(std::make_unique<SimulatedLock>(recorder_, name), name);
}

void SimulatedWorkQueues::runAfter(std::chrono::nanoseconds delay, Task task) {
    using std::chrono::duration_cast;
    const auto milliseconds = duration_cast<std::chrono::milliseconds>(delay).count();
    const RecordedCall call(recorder_, "WorkQueues", "runAfter",
                            std::to_string(milliseconds) + " ms");
    recorder_.scheduler().spawnAfter(delay, "delayed work", std::move(task));
}

}  // namespace appsync
