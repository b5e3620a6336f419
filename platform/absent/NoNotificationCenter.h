#pragma once

#include "platform/Notifications.h"

namespace appsync {

/// No notification centre: no observer is ever called. The client does not learn that the daemon
/// has started up, which it needs only where installs are coordinated: it would then not observe
/// what an earlier process has left.
class NoNotificationCenter final : public NotificationCenter {
  public:
    void addObserver(std::weak_ptr<void> /*observer*/, std::string_view /*name*/,
                     Callback /*callback*/, SuspensionBehavior /*behavior*/) override {}
    void removeObserver(const void* /*observer*/, std::string_view /*name*/) override {}
    void post(std::string_view /*name*/) override {}
};

}  // namespace appsync
