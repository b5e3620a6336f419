#include "system/threads/DelayedWork.h"

#include <algorithm>
#include <utility>

namespace appsync {

namespace {

constexpr std::size_t kMostWorkers = 16;
constexpr std::chrono::nanoseconds kCentury = std::chrono::hours(24 * 365 * 100);

}  // namespace

std::chrono::steady_clock::time_point momentAfter(std::chrono::nanoseconds delay) {
    return std::chrono::steady_clock::now() +
           std::clamp(delay, std::chrono::nanoseconds::zero(), kCentury);
}

DelayedWork::DelayedWork(const ThreadStarter& startThread, OperationQueueBook& book)
    : workers_(startThread, book, kMostWorkers), timer_(startThread([this] { keepTime(); })) {}

void DelayedWork::runAfter(std::chrono::nanoseconds delay, Task task) {
    const std::lock_guard guard(mutex_);
    if (isStopping_) return;
    items_.push_back({momentAfter(delay), nextSequence_++, std::move(task)});
    std::push_heap(items_.begin(), items_.end(), comesLater);
    changed_.notify_one();
}

void DelayedWork::stop() {
    std::vector<Item> dropped;
    {
        const std::lock_guard guard(mutex_);
        isStopping_ = true;
        dropped = std::exchange(items_, {});
        changed_.notify_one();
    }
    if (timer_.joinable()) timer_.join();
    dropped.clear();
    workers_.finish();
}

bool DelayedWork::comesLater(const Item& left, const Item& right) {
    return std::pair(left.due, left.sequence) > std::pair(right.due, right.sequence);
}

void DelayedWork::keepTime() {
    std::unique_lock lock(mutex_);
    while (!isStopping_) {
        if (items_.empty()) {
            changed_.wait(lock);
        } else if (const auto due = items_.front().due; due > std::chrono::steady_clock::now()) {
            changed_.wait_until(lock, due);
        } else {
            Task task = takeFirst();
            lock.unlock();
            workers_.add(std::move(task));
            lock.lock();
        }
    }
}

Task DelayedWork::takeFirst() {
    std::pop_heap(items_.begin(), items_.end(), comesLater);
    Task task = std::move(items_.back().task);
    items_.pop_back();
    return task;
}

}  // namespace appsync
