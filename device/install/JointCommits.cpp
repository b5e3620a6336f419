#include "device/install/JointCommits.h"

#include <condition_variable>
#include <cstddef>
#include <utility>

#include "device/database/DeviceDatabase.h"
#include "device/install/DurabilityBarrier.h"

namespace appsync {

struct JointCommits::Waiting {
    const Change& change;
    Outcome outcome = {};
    bool done = false;
    // Its own, so that nobody wakes who has to go on waiting.
    std::condition_variable wakes = {};
};

JointCommits::Outcome JointCommits::commit(const Change& change) {
    Waiting own{change};
    std::unique_lock lock(mutex_);
    queue_.push_back(&own);
    own.wakes.wait(lock, [&] { return own.done || (!isLeading_ && queue_.front() == &own); });
    if (!own.done) lead(lock);
    return std::move(own.outcome);
}

// For everybody in the queue, the caller among them.
void JointCommits::lead(std::unique_lock<std::mutex>& lock) {
    isLeading_ = true;
    const std::vector<Waiting*> batch = std::exchange(queue_, {});
    lock.unlock();
    commitTogether(batch);
    lock.lock();
    isLeading_ = false;
    for (Waiting* waiting : batch) {
        waiting->done = true;
        waiting->wakes.notify_one();
    }
    if (!queue_.empty()) queue_.front()->wakes.notify_one();
}

void JointCommits::commitTogether(const std::vector<Waiting*>& batch) {
    const Status synced = barrier_.pass();
    if (!synced) {
        for (Waiting* waiting : batch) waiting->outcome.synced = synced;
        return;
    }
    std::vector<DeviceDatabase::Joint> changes;
    changes.reserve(batch.size());
    for (const Waiting* waiting : batch) changes.push_back({waiting->change, {}});
    database_.changeAll(Durability::OnDisk, changes);
    for (std::size_t index = 0; index < batch.size(); ++index) {
        batch[index]->outcome.committed = std::move(changes[index].status);
    }
}

}  // namespace appsync
