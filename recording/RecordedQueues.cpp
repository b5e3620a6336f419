#include "recording/RecordedQueues.h"

#include <cstddef>
#include <cstdint>
#include <utility>

#include "recording/Recording.h"

namespace appsync {
namespace {

/// Runs the task as the item of that number. What the task owns goes before its end is written.
Task recordedItem(Recording& recording, std::uint64_t item, Task task) {
    return [recording = recording.shared_from_this(), item, task = std::move(task)]() mutable {
        const SpanRecord span(*recording, "run", "item", item);
        const Task own = std::exchange(task, nullptr);
        own();
    };
}

class RecordedSerialQueue : public SerialQueue {
  public:
    RecordedSerialQueue(std::unique_ptr<SerialQueue> inner, std::uint64_t number,
                        Recording& recording)
        : inner_(std::move(inner)), number_(number), recording_(recording) {}

    void sync(const Task& task) override {
        const std::uint64_t item = recording_.newNumber();
        const AnnouncedCall call(recording_, "SerialQueue.sync", number_, item);
        inner_->sync([this, item, &task] {
            const SpanRecord span(recording_, "run", "item", item);
            task();
        });
    }

  private:
    const std::unique_ptr<SerialQueue> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

class RecordedOperationQueue : public OperationQueue {
  public:
    RecordedOperationQueue(std::unique_ptr<OperationQueue> inner, std::uint64_t number,
                           Recording& recording)
        : inner_(std::move(inner)), number_(number), recording_(recording) {}

    void add(Task task) override {
        const std::uint64_t item = recording_.newNumber();
        const AnnouncedCall call(recording_, "OperationQueue.add", number_, item);
        inner_->add(recordedItem(recording_, item, std::move(task)));
    }
    void setMaximumConcurrentOperations(std::size_t count) override {
        const AnnouncedCall call(recording_, "OperationQueue.setMaximumConcurrentOperations",
                                 number_, count);
        inner_->setMaximumConcurrentOperations(count);
    }

  private:
    const std::unique_ptr<OperationQueue> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

class RecordedWaitGroup : public WaitGroup {
  public:
    RecordedWaitGroup(std::unique_ptr<WaitGroup> inner, std::uint64_t number, Recording& recording)
        : inner_(std::move(inner)), number_(number), recording_(recording) {}

    void enter() override {
        const AnnouncedCall call(recording_, "WaitGroup.enter", number_);
        inner_->enter();
    }
    // The last one to leave may not touch the group afterwards.
    void leave() override {
        const AnnouncedCall call(recording_, "WaitGroup.leave", number_);
        inner_->leave();
    }
    void wait() override {
        const CallRecord record(recording_, "WaitGroup.wait", number_);
        inner_->wait();
    }
    bool waitFor(std::chrono::nanoseconds timeout) override {
        return CallRecord(recording_, "WaitGroup.waitFor", number_, timeout.count())
            .answer(inner_->waitFor(timeout));
    }

  private:
    const std::unique_ptr<WaitGroup> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

class RecordedSemaphore : public Semaphore {
  public:
    RecordedSemaphore(std::unique_ptr<Semaphore> inner, std::uint64_t number, Recording& recording)
        : inner_(std::move(inner)), number_(number), recording_(recording) {}

    void signal() override {
        const AnnouncedCall call(recording_, "Semaphore.signal", number_);
        inner_->signal();
    }
    bool wait() override {
        return CallRecord(recording_, "Semaphore.wait", number_).answer(inner_->wait());
    }

  private:
    const std::unique_ptr<Semaphore> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

class RecordedLock : public Lock {
  public:
    RecordedLock(std::unique_ptr<Lock> inner, std::uint64_t number, Recording& recording)
        : inner_(std::move(inner)), number_(number), recording_(recording) {}

    void lock() override {
        const CallRecord record(recording_, "Lock.lock", number_);
        inner_->lock();
    }
    void unlock() override {
        const AnnouncedCall call(recording_, "Lock.unlock", number_);
        inner_->unlock();
    }

  private:
    const std::unique_ptr<Lock> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

}  // namespace

std::unique_ptr<SerialQueue> RecordedQueues::makeSerialQueue(std::string_view label) {
    CallRecord record(recording_, "WorkQueues.makeSerialQueue", 0, label);
    return std::make_unique<RecordedSerialQueue>(inner_.makeSerialQueue(label),
                                                 record.answer(recording_.newNumber()), recording_);
}

std::unique_ptr<OperationQueue> RecordedQueues::makeOperationQueue() {
    CallRecord record(recording_, "WorkQueues.makeOperationQueue", 0);
    return std::make_unique<RecordedOperationQueue>(
        inner_.makeOperationQueue(), record.answer(recording_.newNumber()), recording_);
}

std::unique_ptr<WaitGroup> RecordedQueues::makeWaitGroup() {
    CallRecord record(recording_, "WorkQueues.makeWaitGroup", 0);
    return std::make_unique<RecordedWaitGroup>(inner_.makeWaitGroup(),
                                               record.answer(recording_.newNumber()), recording_);
}

std::unique_ptr<Semaphore> RecordedQueues::makeSemaphore(std::int64_t value) {
    CallRecord record(recording_, "WorkQueues.makeSemaphore", 0, value);
    return std::make_unique<RecordedSemaphore>(inner_.makeSemaphore(value),
                                               record.answer(recording_.newNumber()), recording_);
}

std::unique_ptr<Lock> RecordedQueues::makeLock() {
    CallRecord record(recording_, "WorkQueues.makeLock", 0);
    return std::make_unique<RecordedLock>(inner_.makeLock(), record.answer(recording_.newNumber()),
                                          recording_);
}

void RecordedQueues::runAfter(std::chrono::nanoseconds delay, Task task) {
    const std::uint64_t item = recording_.newNumber();
    const AnnouncedCall call(recording_, "WorkQueues.runAfter", 0, delay.count(), item);
    inner_.runAfter(delay, recordedItem(recording_, item, std::move(task)));
}

}  // namespace appsync
