#pragma once

#include "platform/Notifications.h"

namespace appsync {

/// No named notifications: whoever posts is told that it worked, and nobody hears. The home screen
/// does not learn that a sync is starting or done.
class NoNotifications final : public NamedNotifications {
  public:
    Registration registerForState(std::string_view /*name*/) override { return {}; }
    void setState(int /*token*/, std::uint64_t /*state*/) override {}
    void post(std::string_view /*name*/) override {}
};

}  // namespace appsync
