#pragma once

#include <functional>
#include <mutex>
#include <vector>

#include "platform/Result.h"

namespace appsync {

class Database;
class DeviceDatabase;
class DurabilityBarrier;

/// Ends installs, many at a time: those that come while others are made durable and committed share
/// the next sync of the file system and the next transaction. One that is alone waits for nobody.
/// Callable on any thread.
class JointCommits {
  public:
    using Change = std::function<Status(Database&)>;

    /// Both outlive it.
    JointCommits(DurabilityBarrier& barrier, DeviceDatabase& database)
        : barrier_(barrier), database_(database) {}

    struct Outcome {
        Status synced;     // a failure: nothing is known of what was written, and nothing changed
        Status committed;  // only where it was synced
    };

    /// Makes everything that the caller wrote before durable, then makes the change, which is on
    /// disk, too, when the call returns. `change` may run on another thread than the caller's, but
    /// not after the call has returned.
    [[nodiscard]] Outcome commit(const Change& change);

  private:
    struct Waiting;

    void lead(std::unique_lock<std::mutex>& lock);
    void commitTogether(const std::vector<Waiting*>& batch);

    DurabilityBarrier& barrier_;
    DeviceDatabase& database_;

    std::mutex mutex_;
    // Protected by mutex_.
    std::vector<Waiting*> queue_;
    bool isLeading_ = false;
};

}  // namespace appsync
