#include "system/SystemNotifications.h"

#include <algorithm>
#include <utility>

namespace appsync {

SystemNotifications::Record& SystemNotifications::recordOf(std::string_view name) {
    const auto found = records_.find(name);
    return found != records_.end() ? found->second : records_[std::string(name)];
}

NamedNotifications::Registration SystemNotifications::registerForState(std::string_view name) {
    if (name.empty()) return {kInvalidName, 0};
    const std::lock_guard guard(mutex_);
    Record& record = recordOf(name);
    if (record.token == 0) {
        tokens_.push_back(&record);
        record.token = static_cast<int>(tokens_.size());
    }
    return {0, record.token};
}

void SystemNotifications::setState(int token, std::uint64_t state) {
    const std::lock_guard guard(mutex_);
    if (token < 1 || static_cast<std::size_t>(token) > tokens_.size()) return;
    tokens_[static_cast<std::size_t>(token) - 1]->state = state;
}

void SystemNotifications::post(std::string_view name) {
    Listener listener;
    std::uint64_t state = 0;
    {
        const std::lock_guard guard(mutex_);
        Record& record = recordOf(name);
        ++record.posts;
        state = record.state;
        listener = listener_;
    }
    if (listener) listener(name, state);
}

std::uint64_t SystemNotifications::stateOf(std::string_view name) const {
    const std::lock_guard guard(mutex_);
    const auto found = records_.find(name);
    return found != records_.end() ? found->second.state : 0;
}

std::uint64_t SystemNotifications::postCount(std::string_view name) const {
    const std::lock_guard guard(mutex_);
    const auto found = records_.find(name);
    return found != records_.end() ? found->second.posts : 0;
}

void SystemNotifications::setListener(Listener listener) {
    const std::lock_guard guard(mutex_);
    listener_.swap(listener);
}

void SystemNotificationCenter::addObserver(std::weak_ptr<void> observer, std::string_view name,
                                           Callback callback, SuspensionBehavior /*behavior*/) {
    const std::shared_ptr<void> alive = observer.lock();
    const std::lock_guard guard(mutex_);
    registrations_.push_back({std::move(observer), alive.get(), std::string(name), callback});
}

void SystemNotificationCenter::removeObserver(const void* observer, std::string_view name) {
    const std::lock_guard guard(mutex_);
    std::erase_if(registrations_, [&](const Registration& registration) {
        return registration.address == observer && registration.name == name;
    });
}

void SystemNotificationCenter::post(std::string_view name) {
    std::vector<Registration> called;
    {
        const std::lock_guard guard(mutex_);
        std::copy_if(registrations_.begin(), registrations_.end(), std::back_inserter(called),
                     [&](const Registration& registration) { return registration.name == name; });
    }
    for (const Registration& registration : called) {
        const std::shared_ptr<void> observer = registration.observer.lock();
        registration.callback(observer.get());
    }
}

}  // namespace appsync
