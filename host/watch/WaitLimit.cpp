#include "host/watch/WaitLimit.h"

#include <utility>

namespace appsync {

void WaitLimit::set(std::chrono::milliseconds longest) {
    const std::lock_guard guard(mutex_);
    longest_ = longest;
}

void WaitLimit::nothingMoreIsSent() {
    const std::lock_guard guard(mutex_);
    isAllSent_ = true;
}

void WaitLimit::isUnderWay(const std::string& identifier) {
    const std::lock_guard guard(mutex_);
    underWay_.insert(identifier);
}

void WaitLimit::waits(const std::string& identifier) {
    const std::lock_guard guard(mutex_);
    if (underWay_.contains(identifier)) waiting_.insert(identifier);
}

void WaitLimit::goesOn(const std::string& identifier) {
    const std::lock_guard guard(mutex_);
    waiting_.erase(identifier);
}

void WaitLimit::hasEnded(const std::string& identifier) {
    const std::lock_guard guard(mutex_);
    underWay_.erase(identifier);
    waiting_.erase(identifier);
}

std::vector<std::string> WaitLimit::givenUpAt(TimePoint now) {
    const std::lock_guard guard(mutex_);
    const auto sinceLastLook = now - std::exchange(lastLook_, now);
    const bool isOnlyWaiting =
        isAllSent_ && !waiting_.empty() && waiting_.size() == underWay_.size();
    if (!longest_ || isOver_ || !isOnlyWaiting) return {};
    waited_ += sinceLastLook;
    isOver_ = waited_ >= *longest_;
    return isOver_ ? std::vector<std::string>(waiting_.begin(), waiting_.end())
                   : std::vector<std::string>();
}

}  // namespace appsync
