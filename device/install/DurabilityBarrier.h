#pragma once

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <mutex>

#include "platform/Result.h"

namespace appsync {

/// Makes files durable, many at a time: threads that come while a sync of the file system runs
/// share the next one. Callable on any thread.
class DurabilityBarrier {
  public:
    /// Does one sync: 0, or the errno value of its failure.
    using Sync = std::function<int()>;

    /// A barrier for the file system that a descriptor is on. The descriptor outlives it.
    explicit DurabilityBarrier(int descriptor);
    /// A barrier with a sync from elsewhere.
    explicit DurabilityBarrier(Sync sync) : sync_(std::move(sync)) {}

    /// Returns when everything that the caller wrote before is on disk. After a failure nothing is
    /// known of what was written: it has to be written anew.
    Status pass();

    /// How many syncs were done.
    [[nodiscard]] std::uint64_t syncs() const;

  private:
    void syncOnce(std::unique_lock<std::mutex>& lock);

    const Sync sync_;

    mutable std::mutex mutex_;
    // Protected by mutex_. Syncs are numbered from 1.
    std::condition_variable ended_;
    std::uint64_t begun_ = 0;
    std::uint64_t completed_ = 0;
    std::uint64_t lastFailed_ = 0;
    int failure_ = 0;  // the errno value of lastFailed_
};

}  // namespace appsync
