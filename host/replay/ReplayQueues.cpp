#include "host/replay/ReplayQueues.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "host/replay/ReplayRun.h"

namespace appsync {
namespace {

/// What the plug-in was given under a number.
class ReplayedQueuePart {
  public:
    ReplayedQueuePart(ReplayRun& run, std::uint64_t number) : run_(run), number_(number) {}

  protected:
    [[nodiscard]] ReplayRun& run() const { return run_; }
    [[nodiscard]] std::uint64_t number() const { return number_; }

  private:
    ReplayRun& run_;
    const std::uint64_t number_;
};

class ReplaySerialQueue : public SerialQueue, ReplayedQueuePart {
  public:
    using ReplayedQueuePart::ReplayedQueuePart;
    void sync(const Task& task) override {
        run().runHere(ReplayRun::numberIn(run().numberedCall("SerialQueue.sync", number())), task);
    }
};

class ReplayOperationQueue : public OperationQueue, ReplayedQueuePart {
  public:
    using ReplayedQueuePart::ReplayedQueuePart;
    ReplayOperationQueue(const ReplayOperationQueue&) = delete;
    ReplayOperationQueue& operator=(const ReplayOperationQueue&) = delete;
    ~ReplayOperationQueue() override {
        const auto isHere = [this](std::uint64_t item) { return run().isOn(item); };
        if (std::any_of(items_.begin(), items_.end(), isHere)) return;
        run().wait("OperationQueue #" + std::to_string(number()) + " to be empty", [this] {
            return std::all_of(items_.begin(), items_.end(),
                               [this](std::uint64_t item) { return run().isOver(item); });
        });
    }
    void add(Task task) override {
        items_.push_back(ReplayRun::numberIn(run().numberedCall("OperationQueue.add", number())));
        run().queue(items_.back(), std::move(task));
    }
    void setMaximumConcurrentOperations(std::size_t count) override {
        run().call("OperationQueue.setMaximumConcurrentOperations", number(), count);
    }

  private:
    std::vector<std::uint64_t> items_;
};

class ReplayWaitGroup : public WaitGroup, ReplayedQueuePart {
  public:
    using ReplayedQueuePart::ReplayedQueuePart;
    void enter() override { run().call("WaitGroup.enter", number()); }
    void leave() override { run().call("WaitGroup.leave", number()); }
    void wait() override { run().call("WaitGroup.wait", number()); }
    bool waitFor(std::chrono::nanoseconds timeout) override {
        return run().answer<bool>(run().call("WaitGroup.waitFor", number(), timeout.count()));
    }
};

class ReplaySemaphore : public Semaphore, ReplayedQueuePart {
  public:
    using ReplayedQueuePart::ReplayedQueuePart;
    void signal() override { run().call("Semaphore.signal", number()); }
    bool wait() override { return run().answer<bool>(run().call("Semaphore.wait", number())); }
};

class ReplayLock : public Lock, ReplayedQueuePart {
  public:
    using ReplayedQueuePart::ReplayedQueuePart;
    void lock() override { run().call("Lock.lock", number()); }
    void unlock() override { run().call("Lock.unlock", number()); }
};

}  // namespace

std::unique_ptr<SerialQueue> ReplayQueues::makeSerialQueue(std::string_view label) {
    const RecordLine& line = run_.call("WorkQueues.makeSerialQueue", 0, label);
    return std::make_unique<ReplaySerialQueue>(run_, run_.answer<std::uint64_t>(line));
}

std::unique_ptr<OperationQueue> ReplayQueues::makeOperationQueue() {
    const RecordLine& line = run_.call("WorkQueues.makeOperationQueue", 0);
    return std::make_unique<ReplayOperationQueue>(run_, run_.answer<std::uint64_t>(line));
}

std::unique_ptr<WaitGroup> ReplayQueues::makeWaitGroup() {
    const RecordLine& line = run_.call("WorkQueues.makeWaitGroup", 0);
    return std::make_unique<ReplayWaitGroup>(run_, run_.answer<std::uint64_t>(line));
}

std::unique_ptr<Semaphore> ReplayQueues::makeSemaphore(std::int64_t value) {
    const RecordLine& line = run_.call("WorkQueues.makeSemaphore", 0, value);
    return std::make_unique<ReplaySemaphore>(run_, run_.answer<std::uint64_t>(line));
}

std::unique_ptr<Lock> ReplayQueues::makeLock() {
    const RecordLine& line = run_.call("WorkQueues.makeLock", 0);
    return std::make_unique<ReplayLock>(run_, run_.answer<std::uint64_t>(line));
}

void ReplayQueues::runAfter(std::chrono::nanoseconds delay, Task task) {
    const RecordLine& line = run_.numberedCall("WorkQueues.runAfter", 0, delay.count());
    run_.queue(ReplayRun::numberIn(line), std::move(task));
}

}  // namespace appsync
