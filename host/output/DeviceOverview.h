#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include <nlohmann/json_fwd.hpp>

#include "device/values/DeviceRecords.h"
#include "host/plan/InterruptedStaging.h"
#include "platform/Result.h"

namespace appsync {

class Device;

/// A device at a glance.
struct DeviceOverview {
    DeviceSettings settings;
    std::size_t installed = 0;
    std::size_t offloaded = 0;
    /// Placeholders of a restore, and those of installs that are under way or were interrupted.
    std::size_t restored = 0;
    std::size_t arriving = 0;
    std::vector<std::string> running;
    SessionRecord session;
    /// Whose installs a session has begun that is over, sorted.
    std::vector<std::string> open;
    /// Only while no session is under way.
    StagedWork staged = StagedWork::None;
    std::uint64_t free = 0;
    std::uint64_t reserve = 0;
    /// The versions that are kept for a rollback, and what they take of the free space.
    std::size_t kept = 0;
    std::uint64_t keptBytes = 0;
};

/// What there is to say of a device that was asked for its `moment`; the error has the exit status
/// "unusable".
[[nodiscard]] Result<DeviceOverview> overviewOf(Device& device, const DeviceMoment& moment);

/// Counts an application or a placeholder.
void count(DeviceOverview& overview, const ApplicationRecord& record);

/// Whether a sync has begun to install it, and has not come to the end of that: of a placeholder on
/// the direct path, and of a coordinator.
[[nodiscard]] bool isOpenInstall(const ApplicationRecord& record);
[[nodiscard]] bool isOpenInstall(const CoordinatorRecord& coordinator);

/// A line for each thing, for people; where a width is given, several where it is longer.
[[nodiscard]] std::string overviewText(const DeviceOverview& overview, std::size_t width = 0);
/// One JSON object, over several lines, without a line end.
[[nodiscard]] std::string jsonText(const DeviceOverview& overview);
/// The same for a text that holds more.
[[nodiscard]] nlohmann::ordered_json jsonOf(const DeviceOverview& overview);

}  // namespace appsync
