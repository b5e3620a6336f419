#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

namespace appsync {

/// Posted by the daemon when it has finished starting.
inline constexpr std::string_view kStartupCompleteNotification =
    "com.korvu.trd.TRStartupCompleteNotification";

/// System-wide named notifications that carry a 64-bit state. Callable on any thread.
class NamedNotifications {
  public:
    /// What comes of a registration.
    struct Registration {
        /// 0 when the registration succeeded.
        std::uint32_t status = 0;
        int token = 0;
    };

    virtual ~NamedNotifications() = default;

    /// Registers for a state token of the name. All tokens of a name stand for one state.
    virtual Registration registerForState(std::string_view name) = 0;
    /// Every process sees it from now on.
    virtual void setState(int token, std::uint64_t state) = 0;
    virtual void post(std::string_view name) = 0;
};

/// The cross-process notification centre: system-wide, by name only. Callable on any thread.
class NotificationCenter {
  public:
    /// Called, on any thread, with the observer, which is kept alive meanwhile; with null when the
    /// observer has gone.
    using Callback = void (*)(void* observer);
    enum class SuspensionBehavior { Drop };

    virtual ~NotificationCenter() = default;

    /// From now on `callback` is called when a notification of the name is posted by anyone.
    virtual void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                             SuspensionBehavior behavior) = 0;
    /// Ends that. The observer is known by its address: it may be in its destructor.
    virtual void removeObserver(const void* observer, std::string_view name) = 0;

    /// Calls every observer of the name. For the process that hosts the plug-in: it says so that it
    /// has started up.
    virtual void post(std::string_view name) = 0;
};

}  // namespace appsync
