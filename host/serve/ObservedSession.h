#pragma once

#include <optional>
#include <set>
#include <string>

#include <nlohmann/json_fwd.hpp>

#include "device/values/DeviceRecords.h"

namespace appsync {

/// What is seen of the session that is under way on a device, which itself keeps no count: the
/// installs that have begun since somebody looks, and how many of them have ended.
class ObservedSession {
  public:
    void see(const DeviceMoment& moment);

    /// An object; null where nothing is known of any session.
    [[nodiscard]] nlohmann::ordered_json json() const;

  private:
    void seeInstalls(const DeviceMoment& moment);

    SessionRecord record_;
    std::set<std::string> begun_;
    std::size_t underWay_ = 0;
    std::optional<std::string> phase_;
};

}  // namespace appsync
