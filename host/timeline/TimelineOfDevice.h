#pragma once

#include <chrono>
#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include "device/values/DeviceRecords.h"
#include "host/timeline/Timeline.h"
#include "host/timeline/TimelineEvents.h"
#include "platform/Result.h"

namespace appsync {

class Device;

struct DeviceTimelineOptions {
    /// Which session, counted back: 1 is the last, or the one that is under way.
    std::size_t session = 1;
    /// Until when a session that is under way is drawn; nothing: until its last message.
    std::optional<WallTime> now;
};

/// What the device's log tells of a session; where the log has lost it, its history. A device that
/// knows of no session gives an empty timeline. An error where log or database cannot be read, and
/// where there are fewer sessions.
[[nodiscard]] Result<Timeline> timelineOfDevice(Device& device, const std::string& shownName,
                                                const DeviceTimelineOptions& options = {});

/// What the records of the transaction log tell of that were made before that time, and belong
/// together; without one, the last that do. In the order of the records: several threads write
/// them, and their times need not rise.
[[nodiscard]] std::vector<TimedEvent> eventsBefore(const std::vector<HistoryRecord>& records,
                                                   const std::optional<WallTime>& time);

}  // namespace appsync
