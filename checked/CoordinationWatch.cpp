#include "checked/CoordinationWatch.h"

#include "checked/Overdue.h"

namespace appsync {

CoordinationWatch::Call::Call(CoordinationWatch& watch)
    : watch_(watch), thread_(watch.book_->currentThread()), isWithinReport_(watch.begin(thread_)) {}

CoordinationWatch::Call::~Call() {
    if (isWithinReport_ != nullptr) {
        *isWithinReport_ = false;
    } else {
        watch_.endOne(thread_, &Thread::calls);
    }
}

CoordinationWatch::Report::Report(CoordinationWatch& watch)
    : watch_(watch), thread_(watch.book_->currentThread()) {
    if (watch_.isCaller()) {
        watch_.book_->broken(
            "platform/InstallCoordinator.h",
            "Hears of coordinators, on threads of the service's, several at once.",
            "an observer was called on a thread that was in a call of the service");
    }
    const std::lock_guard guard(watch_.mutex_);
    ++watch_.threads_[thread_].reports;
}

CoordinationWatch::Report::~Report() { watch_.endOne(thread_, &Thread::reports); }

bool CoordinationWatch::isCaller() {
    const std::uintptr_t thread = book_->currentThread();
    const std::lock_guard guard(mutex_);
    const auto found = threads_.find(thread);
    return found != threads_.end() && found->second.calls != 0;
}

std::shared_ptr<std::atomic<bool>> CoordinationWatch::begin(std::uintptr_t thread) {
    {
        const std::lock_guard guard(mutex_);
        Thread& caller = threads_[thread];
        if (caller.reports == 0) {
            ++caller.calls;
            return nullptr;
        }
    }
    auto goesOn = std::make_shared<std::atomic<bool>>(true);
    reportIfOverdue(
        queues_, patience_ / kWaits, [goesOn] { return goesOn->load(); },
        [book = book_] {
            book->broken("platform/InstallCoordinator.h",
                         "Hears of coordinators, on threads of the service's, several at once.",
                         "a call of the service by an observer was not answered in time");
        });
    return goesOn;
}

void CoordinationWatch::endOne(std::uintptr_t thread, std::size_t Thread::*count) {
    const std::lock_guard guard(mutex_);
    const auto found = threads_.find(thread);
    --(found->second.*count);
    if (found->second.calls == 0 && found->second.reports == 0) threads_.erase(found);
}

}  // namespace appsync
