#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <utility>
#include <vector>

#include "contract/forwarding/ForwardingWorkQueues.h"
#include "tests/violators/Violator.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;

// Serial queues.

template <typename Queue>
struct WithSerialQueue : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override {
        return std::make_unique<Queue>(target().makeSerialQueue(label), target());
    }
};

struct SerialQueueWithQueues : ForwardingSerialQueue {
    SerialQueueWithQueues(std::unique_ptr<SerialQueue> target, WorkQueues& makers)
        : ForwardingSerialQueue(std::move(target)), queues(makers) {}
    WorkQueues& queues;
};
struct ReturningAtOnce : SerialQueueWithQueues {
    using SerialQueueWithQueues::SerialQueueWithQueues;
    void sync(const Task& task) override { queues.runAfter(0ns, task); }
};
struct Overlapping : SerialQueueWithQueues {
    using SerialQueueWithQueues::SerialQueueWithQueues;
    void sync(const Task& task) override { task(); }
};
struct RunningTwice : SerialQueueWithQueues {
    using SerialQueueWithQueues::SerialQueueWithQueues;
    void sync(const Task& task) override {
        target_->sync(task);
        target_->sync(task);
    }
};
struct Losing : SerialQueueWithQueues {
    using SerialQueueWithQueues::SerialQueueWithQueues;
    void sync(const Task& task) override {
        if (++count % 100 != 0) target_->sync(task);
    }
    int count = 0;
};
struct OneSerialQueueForAll : ForwardingWorkQueues {
    explicit OneSerialQueueForAll(WorkQueues& target)
        : ForwardingWorkQueues(target), one(target.makeSerialQueue("one for all")) {}
    struct Shared : SerialQueue {
        explicit Shared(SerialQueue& queue) : one(queue) {}
        void sync(const Task& task) override { one.sync(task); }
        SerialQueue& one;
    };
    std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view) override {
        return std::make_unique<Shared>(*one);
    }
    std::unique_ptr<SerialQueue> one;
};

// Groups.

template <typename Group>
struct WithGroup : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    std::unique_ptr<WaitGroup> makeWaitGroup() override {
        return std::make_unique<Group>(target().makeWaitGroup());
    }
};

struct NotWaiting : ForwardingWaitGroup {
    using ForwardingWaitGroup::ForwardingWaitGroup;
    void wait() override {}
};
struct NeverEmpty : ForwardingWaitGroup {
    explicit NeverEmpty(std::unique_ptr<WaitGroup> group) : ForwardingWaitGroup(std::move(group)) {
        target_->enter();
    }
};
struct NeverTimingOut : ForwardingWaitGroup {
    using ForwardingWaitGroup::ForwardingWaitGroup;
    bool waitFor(std::chrono::nanoseconds timeout) override {
        return target_->waitFor(timeout) || true;
    }
};
struct AlwaysTimingOut : ForwardingWaitGroup {
    using ForwardingWaitGroup::ForwardingWaitGroup;
    bool waitFor(std::chrono::nanoseconds timeout) override {
        return target_->waitFor(timeout) && false;
    }
};
struct TimingOutEarly : ForwardingWaitGroup {
    using ForwardingWaitGroup::ForwardingWaitGroup;
    bool waitFor(std::chrono::nanoseconds timeout) override {
        return target_->waitFor(timeout / 2);
    }
};
struct WaitingWithoutLimit : ForwardingWaitGroup {
    using ForwardingWaitGroup::ForwardingWaitGroup;
    bool waitFor(std::chrono::nanoseconds) override {
        target_->wait();
        return true;
    }
};
struct GoodForOneWait : ForwardingWaitGroup {
    using ForwardingWaitGroup::ForwardingWaitGroup;
    void enter() override {
        if (!over) target_->enter();
    }
    void leave() override {
        if (!over) target_->leave();
    }
    void wait() override {
        if (over) return;
        target_->wait();
        over = true;
    }
    bool over = false;
};
struct OneLeaveUndoesAll : ForwardingWaitGroup {
    using ForwardingWaitGroup::ForwardingWaitGroup;
    void enter() override {
        if (entered++ == 0) target_->enter();
    }
    void leave() override {
        if (entered > 0) target_->leave();
        entered = 0;
    }
    int entered = 0;
};

// Semaphores and locks.

template <typename Kind>
struct WithSemaphore : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    std::unique_ptr<Semaphore> makeSemaphore(std::int64_t value) override {
        return std::make_unique<Kind>(target().makeSemaphore(value));
    }
};

struct BeginningAtNothing : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    std::unique_ptr<Semaphore> makeSemaphore(std::int64_t) override {
        return target().makeSemaphore(0);
    }
};
struct SayingThatItTimedOut : ForwardingSemaphore {
    using ForwardingSemaphore::ForwardingSemaphore;
    bool wait() override { return target_->wait() && false; }
};
struct NeverBlocking : ForwardingSemaphore {
    using ForwardingSemaphore::ForwardingSemaphore;
    bool wait() override { return true; }
};
struct TakingNoSignal : ForwardingSemaphore {
    using ForwardingSemaphore::ForwardingSemaphore;
    bool wait() override {
        const bool signalled = target_->wait();
        target_->signal();
        return signalled;
    }
};
struct LosingEverySecondSignal : ForwardingSemaphore {
    using ForwardingSemaphore::ForwardingSemaphore;
    void signal() override {
        if (++count % 2 == 1) target_->signal();
    }
    int count = 0;
};
struct NotExcluding : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    struct Open : Lock {
        void lock() override {}
        void unlock() override {}
    };
    std::unique_ptr<Lock> makeLock() override { return std::make_unique<Open>(); }
};

// Operation queues.

template <typename Queue>
struct WithOperations : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    std::unique_ptr<OperationQueue> makeOperationQueue() override {
        return std::make_unique<Queue>(target().makeOperationQueue(), target());
    }
};

struct OperationsWithQueues : ForwardingOperationQueue {
    OperationsWithQueues(std::unique_ptr<OperationQueue> target, WorkQueues& makers)
        : ForwardingOperationQueue(std::move(target)), queues(makers) {}
    WorkQueues& queues;
};
/// Starts what was added once it has ended up with three of them, the last first.
struct LastFirst : OperationsWithQueues {
    using OperationsWithQueues::OperationsWithQueues;
    ~LastFirst() override { flush(); }
    void add(Task task) override {
        tasks.push_back(std::move(task));
        if (tasks.size() == 3) flush();
    }
    void flush() {
        while (!tasks.empty()) {
            target_->add(std::move(tasks.back()));
            tasks.pop_back();
        }
    }
    std::vector<Task> tasks;
};
struct WithoutBound : OperationsWithQueues {
    using OperationsWithQueues::OperationsWithQueues;
    void setMaximumConcurrentOperations(std::size_t) override {
        target_->setMaximumConcurrentOperations(1000);
    }
};
struct OneAtATime : OperationsWithQueues {
    using OperationsWithQueues::OperationsWithQueues;
    void setMaximumConcurrentOperations(std::size_t) override {
        target_->setMaximumConcurrentOperations(1);
    }
};
struct OnTheCallersThread : OperationsWithQueues {
    using OperationsWithQueues::OperationsWithQueues;
    void add(Task task) override { task(); }
};
/// Its operations go on when it is gone.
struct NotWaitedFor : OperationsWithQueues {
    using OperationsWithQueues::OperationsWithQueues;
    void add(Task task) override { queues.runAfter(0ns, std::move(task)); }
};
/// Keeps back the last operation, and forgets it when it is destroyed.
struct ForgettingWhatWaits : OperationsWithQueues {
    using OperationsWithQueues::OperationsWithQueues;
    void add(Task task) override {
        if (waiting) target_->add(std::move(waiting));
        waiting = std::move(task);
    }
    Task waiting;
};
struct LosingTheFifth : OperationsWithQueues {
    using OperationsWithQueues::OperationsWithQueues;
    void add(Task task) override {
        if (++count != 5) target_->add(std::move(task));
    }
    int count = 0;
};
struct OperationsRunTwice : OperationsWithQueues {
    using OperationsWithQueues::OperationsWithQueues;
    void add(Task task) override {
        target_->add([task = std::move(task)] {
            task();
            task();
        });
    }
};
/// Waits for the operation that destroys it, too.
struct WaitingForItself : OperationsWithQueues {
    WaitingForItself(std::unique_ptr<OperationQueue> target, WorkQueues& makers)
        : OperationsWithQueues(std::move(target), makers), running(makers.makeWaitGroup()) {}
    ~WaitingForItself() override { running->wait(); }
    void add(Task task) override {
        running->enter();
        target_->add([this, task = std::move(task)]() mutable {
            task();
            task = nullptr;
            running->leave();
        });
    }
    const std::unique_ptr<WaitGroup> running;
};

// Delayed work.

struct NotDelaying : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    void runAfter(std::chrono::nanoseconds, Task task) override {
        target().runAfter(0ns, std::move(task));
    }
};
struct RunningDelayedWorkEarly : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    void runAfter(std::chrono::nanoseconds delay, Task task) override {
        target().runAfter(delay - delay / 3, std::move(task));
    }
};
struct NoWorkWithoutDelay : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    void runAfter(std::chrono::nanoseconds delay, Task task) override {
        if (delay > 0ns) target().runAfter(delay, std::move(task));
    }
};
struct DelayedWorkOnTheCallersThread : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    void runAfter(std::chrono::nanoseconds delay, Task task) override {
        if (delay == 0ns) {
            task();
        } else {
            target().runAfter(delay, std::move(task));
        }
    }
};
/// Work that is delayed while other delayed work runs is lost.
struct LosingNestedDelays : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    void runAfter(std::chrono::nanoseconds delay, Task task) override {
        if (running) return;
        target().runAfter(delay, [this, task = std::move(task)] {
            running = true;
            task();
            running = false;
        });
    }
    bool running = false;
};
struct DelayedWorkRunsTwice : ForwardingWorkQueues {
    using ForwardingWorkQueues::ForwardingWorkQueues;
    void runAfter(std::chrono::nanoseconds delay, Task task) override {
        target().runAfter(delay, task);
        target().runAfter(delay, std::move(task));
    }
};

}  // namespace

std::vector<Violator> workQueueViolators() {
    Violators v("platform/WorkQueues.h", "*WorkQueues*");
    const std::string serial = "Runs its tasks one at a time, in the order of submission.";
    const std::string sync = "Runs the task and returns when it is done.";
    v.system<WithSerialQueue<ReturningAtOnce>>("SyncReturnsAtOnce", sync);
    v.system<WithSerialQueue<RunningTwice>>("SyncRunsTwice", sync);
    v.system<WithSerialQueue<Losing>>("SyncLosesTasks", sync);
    v.system<WithSerialQueue<Overlapping>>("SerialTasksOverlap", serial);
    v.system<OneSerialQueueForAll>("OneSerialQueueForAll", "a task of another queue may call it.");
    v.system<WithGroup<NotWaiting>>("GroupDoesNotWait",
                                    "Returns when every enter has been undone.");
    v.system<WithGroup<NeverEmpty>>("GroupIsNeverEmpty", "At once when there is none.");
    v.system<WithGroup<NeverTimingOut>>("GroupNeverTimesOut", "False when it ran out.");
    v.system<WithGroup<AlwaysTimingOut>>("GroupAlwaysTimesOut", "False when it ran out.");
    v.system<WithGroup<TimingOutEarly>>("GroupTimesOutEarly",
                                        "The same, but for at most `timeout`.");
    v.system<WithGroup<WaitingWithoutLimit>>("GroupWaitsWithoutLimit",
                                             "The same, but for at most `timeout`.");
    v.system<WithGroup<GoodForOneWait>>("GroupIsGoodForOneWait", "Counts work in flight.");
    v.system<WithGroup<OneLeaveUndoesAll>>("OneLeaveUndoesAll", "Undoes one enter.");
    v.system<BeginningAtNothing>("SemaphoreBeginsAtNothing", "A counting semaphore.");
    v.system<WithSemaphore<SayingThatItTimedOut>>(
        "SemaphoreTimesOut", "False when the wait timed out, which without a limit it never does.");
    v.system<WithSemaphore<NeverBlocking>>("SemaphoreNeverBlocks",
                                           "Waits without limit and takes one signal.");
    v.system<WithSemaphore<TakingNoSignal>>("SemaphoreTakesNoSignal",
                                            "Waits without limit and takes one signal.");
    v.system<WithSemaphore<LosingEverySecondSignal>>("SemaphoreLosesSignals",
                                                     "A counting semaphore.");
    v.system<NotExcluding>("LockDoesNotExclude",
                           "Mutual exclusion that may be held across calls of the platform");
    const std::string operations =
        "Runs tasks on threads of its own, a bounded number at a time, started in the order of "
        "submission.";
    v.system<WithOperations<LastFirst>>("OperationsStartLastFirst", operations);
    v.system<WithOperations<WithoutBound>>("OperationsHaveNoBound", operations);
    v.system<WithOperations<OneAtATime>>("OperationsRunOneAtATime", operations);
    v.system<WithOperations<OnTheCallersThread>>("OperationsRunOnTheCallersThread", operations);
    v.system<WithOperations<LosingTheFifth>>("TheFifthOperationIsLost", operations);
    v.system<WithOperations<OperationsRunTwice>>("OperationsRunTwice", operations);
    const std::string destruction =
        "Its destruction waits for the tasks that were submitted, unless one of them destroys it.";
    v.system<WithOperations<NotWaitedFor>>("OperationsAreNotWaitedFor", destruction);
    v.system<WithOperations<ForgettingWhatWaits>>("WaitingOperationsAreForgotten", destruction);
    v.system<WithOperations<WaitingForItself>>("AnOperationWaitsForItself", destruction);
    const std::string after =
        "Runs the task on the global default-priority queue, once `delay` has passed.";
    v.system<NotDelaying>("DelayedWorkRunsAtOnce", after);
    v.system<RunningDelayedWorkEarly>("DelayedWorkRunsEarly", after);
    v.system<NoWorkWithoutDelay>("WorkWithoutDelayIsLost", after);
    v.system<DelayedWorkOnTheCallersThread>("DelayedWorkRunsOnTheCallersThread", after);
    v.system<LosingNestedDelays>("NestedDelaysAreLost", after);
    v.system<DelayedWorkRunsTwice>("DelayedWorkRunsTwice", after);
    return v.take();
}

}  // namespace appsync
