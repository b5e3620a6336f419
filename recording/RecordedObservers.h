#pragma once

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <utility>

namespace appsync {

/// What stands for the plug-in's observers with a service, one for each: kept here, since services
/// hold observers weakly. Any thread.
template <typename Observer>
class RecordedObservers {
  public:
    /// What stands for it; `make` makes it where nothing does.
    template <typename Make>
    std::shared_ptr<Observer> standInFor(const void* address, const std::weak_ptr<void>& observer,
                                         Make make) {
        const std::lock_guard guard(mutex_);
        Entry& entry = entries_[address];
        // Another may have come to stand at the same address.
        const bool isSame = !entry.observer.owner_before(observer) &&
                            !observer.owner_before(entry.observer) && entry.standIn != nullptr;
        if (!isSame) entry = {observer, make()};
        return entry.standIn;
    }
    /// What stands for it, which does so no more; null where nothing does.
    std::shared_ptr<Observer> take(const void* address) {
        const std::lock_guard guard(mutex_);
        const auto found = entries_.find(address);
        if (found == entries_.end()) return nullptr;
        std::shared_ptr<Observer> standIn = std::move(found->second.standIn);
        entries_.erase(found);
        return standIn;
    }

  private:
    struct Entry {
        std::weak_ptr<void> observer;
        std::shared_ptr<Observer> standIn;
    };

    std::mutex mutex_;
    std::map<const void*, Entry> entries_;  // guarded by mutex_
};

}  // namespace appsync
