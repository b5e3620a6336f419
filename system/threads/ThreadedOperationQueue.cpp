#include "system/threads/ThreadedOperationQueue.h"

#include <algorithm>
#include <deque>
#include <iterator>
#include <system_error>
#include <utility>

namespace appsync {

void OperationQueueBook::opened() {
    const std::lock_guard guard(mutex_);
    ++open_;
}

// The one who waits may destroy the book at once, so it is woken before the mutex is free again.
void OperationQueueBook::closed(std::vector<std::thread> threads) {
    const std::lock_guard guard(mutex_);
    --open_;
    std::move(threads.begin(), threads.end(), std::back_inserter(threads_));
    changed_.notify_all();
}

void OperationQueueBook::waitForAll() {
    std::unique_lock lock(mutex_);
    while (open_ > 0 || !threads_.empty()) {
        changed_.wait(lock, [this] { return open_ == 0 || !threads_.empty(); });
        std::vector<std::thread> ended = std::exchange(threads_, {});
        lock.unlock();
        for (std::thread& thread : ended) thread.join();
        lock.lock();
    }
}

class ThreadedOperationQueue::State : public std::enable_shared_from_this<State> {
  public:
    State(ThreadStarter startThread, std::size_t maximum)
        : startThread_(std::move(startThread)), maximum_(maximum) {}

    void add(Task task) {
        std::unique_lock lock(mutex_);
        waiting_.push_back(std::move(task));
        startThreads();
        changed_.notify_one();
        if (!hadThreads_ && !isDraining_) drain(lock);
    }

    void setMaximum(std::size_t maximum) {
        const std::lock_guard guard(mutex_);
        maximum_ = std::max<std::size_t>(maximum, 1);
        startThreads();
        changed_.notify_all();
    }

    /// From now on no thread is started, and those that there are end when no task is left. Returns
    /// them.
    std::vector<std::thread> close() {
        std::unique_lock lock(mutex_);
        isClosing_ = true;
        changed_.notify_all();
        const bool drainsHere = drainer_ == std::this_thread::get_id();
        if (!drainsHere) changed_.wait(lock, [this] { return !isDraining_; });
        return std::exchange(threads_, {});
    }

  private:
    [[nodiscard]] bool mayStart() const { return !waiting_.empty() && running_ < maximum_; }
    [[nodiscard]] bool isOver() const { return isClosing_ && waiting_.empty(); }

    [[nodiscard]] bool needsThread() const {
        const std::size_t free = threads_.size() - running_;
        return !isClosing_ && threads_.size() < maximum_ && free < waiting_.size();
    }

    void startThreads() {
        while (needsThread() && startThread()) hadThreads_ = true;
    }

    bool startThread() {
        try {
            threads_.push_back(startThread_([state = shared_from_this()] { state->work(); }));
            return true;
        } catch (const std::system_error&) {
            return false;
        }
    }

    void work() {
        std::unique_lock lock(mutex_);
        while (true) {
            changed_.wait(lock, [this] { return mayStart() || isOver(); });
            if (!mayStart()) break;
            ++running_;
            runNext(lock);
            --running_;
        }
        // Those that waited while the maximum was reached have nothing to wait for any more.
        changed_.notify_all();
    }

    /// Runs what waits on this thread, because there is no other.
    void drain(std::unique_lock<std::mutex>& lock) {
        isDraining_ = true;
        drainer_ = std::this_thread::get_id();
        while (!waiting_.empty()) runNext(lock);
        isDraining_ = false;
        drainer_ = {};
        changed_.notify_all();
    }

    void runNext(std::unique_lock<std::mutex>& lock) {
        Task task = std::move(waiting_.front());
        waiting_.pop_front();
        lock.unlock();
        task();
        task = nullptr;  // what it holds may have work to do when it dies
        lock.lock();
    }

    const ThreadStarter startThread_;
    std::mutex mutex_;
    std::condition_variable changed_;
    // State below is protected by mutex_.
    std::deque<Task> waiting_;
    std::vector<std::thread> threads_;
    std::size_t maximum_;
    std::size_t running_ = 0;  // tasks on threads_
    bool hadThreads_ = false;
    bool isClosing_ = false;
    bool isDraining_ = false;
    std::thread::id drainer_;
};

ThreadedOperationQueue::ThreadedOperationQueue(ThreadStarter startThread, OperationQueueBook& book,
                                               std::size_t maximum)
    : state_(std::make_shared<State>(std::move(startThread), std::max<std::size_t>(maximum, 1))),
      book_(book) {
    book_.opened();
}

ThreadedOperationQueue::~ThreadedOperationQueue() { finish(); }

void ThreadedOperationQueue::add(Task task) {
    // The task may destroy this queue before the call is over.
    const std::shared_ptr<State> state = state_;
    state->add(std::move(task));
}

void ThreadedOperationQueue::setMaximumConcurrentOperations(std::size_t count) {
    state_->setMaximum(count);
}

void ThreadedOperationQueue::finish() {
    if (std::exchange(isFinished_, true)) return;
    std::vector<std::thread> threads = state_->close();
    const auto runsHere = [](const std::thread& thread) {
        return thread.get_id() == std::this_thread::get_id();
    };
    if (std::none_of(threads.begin(), threads.end(), runsHere)) {
        for (std::thread& thread : threads) thread.join();
        threads.clear();
    }
    book_.closed(std::move(threads));
}

}  // namespace appsync
