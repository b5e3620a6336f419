#include <ostream>

#include "device/Device.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/look/LookCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/output/DeviceOverview.h"

namespace appsync {
namespace {

Status gatherApplications(Device& device, DeviceOverview& overview) {
    const Result<std::vector<ApplicationRecord>> records = device.applications();
    if (!records) return unusable(records.error());
    for (const ApplicationRecord& record : *records) count(overview, record);
    Result<std::vector<std::string>> running = device.running();
    if (!running) return unusable(running.error());
    overview.running = *std::move(running);
    return {};
}

Status gatherSession(Device& device, DeviceOverview& overview) {
    const Result<SessionRecord> session = device.session();
    if (!session) return unusable(session.error());
    overview.session = *session;
    if (!session->isUnderWay) overview.staged = stagedWorkOn(device);
    return {};
}

Result<DeviceOverview> overviewOf(Device& device) {
    DeviceOverview overview;
    const Result<DeviceSettings> settings = device.settings();
    if (!settings) return unusable(settings.error());
    overview.settings = *settings;
    Status status = gatherApplications(device, overview);
    if (status) status = gatherSession(device, overview);
    if (!status) return status.error();
    const Result<std::uint64_t> free = device.freeSpace();
    if (!free) return unusable(free.error());
    overview.free = *free;
    overview.reserve = device.spaceReserve();
    return overview;
}

}  // namespace

int runStatus(const std::string& device, bool asJson, const Console& console) {
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<DeviceOverview> overview = overviewOf(opened);
        if (!overview) return overview.error();
        console.out << (asJson ? jsonText(*overview) + "\n" : overviewText(*overview));
        return {};
    });
}

}  // namespace appsync
