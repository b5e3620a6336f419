#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Notifications.h"

namespace appsync {

/// Named notifications between the parts of one process. All members are callable on any thread.
class SystemNotifications : public NamedNotifications {
  public:
    /// The status of a registration for a name that is empty.
    static constexpr std::uint32_t kInvalidName = 1;

    /// Hears of each post: the name, and its state at that moment.
    using Listener = std::function<void(std::string_view name, std::uint64_t state)>;

    Registration registerForState(std::string_view name) override;
    /// A token that was never given out changes nothing.
    void setState(int token, std::uint64_t state) override;
    void post(std::string_view name) override;

    /// The state of the name; 0 until one was set.
    [[nodiscard]] std::uint64_t stateOf(std::string_view name) const;
    /// How many times the name was posted.
    [[nodiscard]] std::uint64_t postCount(std::string_view name) const;

    /// From now on the listener is called, on the thread that posts, after each post of any name.
    /// It may call this object. An empty one ends that; a call that is under way goes on.
    void setListener(Listener listener);

  private:
    struct Record {
        int token = 0;
        std::uint64_t state = 0;
        std::uint64_t posts = 0;
    };

    Record& recordOf(std::string_view name);

    mutable std::mutex mutex_;
    // Protected by mutex_.
    std::map<std::string, Record, std::less<>> records_;
    std::vector<Record*> tokens_;  // token 1 stands first
    Listener listener_;
};

/// The notification centre of one process. All members are callable on any thread.
class SystemNotificationCenter : public NotificationCenter {
  public:
    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override;
    void removeObserver(const void* observer, std::string_view name) override;

    /// Calls every observer of the name, on this thread, in the order in which they were added.
    void post(std::string_view name) override;

  private:
    struct Registration {
        std::weak_ptr<void> observer;
        const void* address = nullptr;
        std::string name;
        Callback callback = nullptr;
    };

    std::mutex mutex_;
    // Protected by mutex_.
    std::vector<Registration> registrations_;
};

}  // namespace appsync
