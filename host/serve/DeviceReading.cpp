#include "host/serve/DeviceReading.h"

#include <utility>

#include "device/Device.h"

namespace appsync {

Result<DeviceReading> readDevice(Device& device) {
    DeviceReading reading;
    Result<DeviceMoment> moment = device.moment();
    if (!moment) return moment.error();
    reading.moment = *std::move(moment);
    Result<std::vector<std::string>> order = device.homeScreenOrder();
    if (!order) return order.error();
    reading.homeScreen = *std::move(order);
    Result<DeviceOverview> overview = overviewOf(device, reading.moment);
    if (!overview) return overview.error();
    reading.overview = *std::move(overview);
    return reading;
}

}  // namespace appsync
