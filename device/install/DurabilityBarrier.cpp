#include "device/install/DurabilityBarrier.h"

#include <unistd.h>

#include <cerrno>

#include "system/file/PosixError.h"

namespace appsync {

DurabilityBarrier::DurabilityBarrier(int descriptor)
    : sync_([descriptor] { return ::syncfs(descriptor) == 0 ? 0 : errno; }) {}

Status DurabilityBarrier::pass() {
    std::unique_lock lock(mutex_);
    // A sync that runs already may have passed over what the caller wrote meanwhile.
    const std::uint64_t needed = begun_ + 1;
    while (completed_ < needed) {
        if (begun_ == completed_) {
            syncOnce(lock);
        } else {
            ended_.wait(lock);
        }
    }
    if (lastFailed_ < needed) return {};
    return posixError(failure_, "sync", "the device's file system");
}

void DurabilityBarrier::syncOnce(std::unique_lock<std::mutex>& lock) {
    ++begun_;
    lock.unlock();
    const int failure = sync_();
    lock.lock();
    completed_ = begun_;
    if (failure != 0) {
        lastFailed_ = completed_;
        failure_ = failure;
    }
    ended_.notify_all();
}

std::uint64_t DurabilityBarrier::syncs() const {
    const std::lock_guard lock(mutex_);
    return completed_;
}

}  // namespace appsync
