#pragma once

#include <string>
#include <vector>

#include "device/values/DeviceRecords.h"
#include "host/output/DeviceOverview.h"
#include "platform/Result.h"

namespace appsync {

class Device;

/// What a page shows of a device, as it was read at one moment.
struct DeviceReading {
    DeviceMoment moment;
    std::vector<std::string> homeScreen;
    DeviceOverview overview;
};

[[nodiscard]] Result<DeviceReading> readDevice(Device& device);

}  // namespace appsync
