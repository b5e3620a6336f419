#include <ostream>
#include <set>

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

// Of a session that is over.
Status gatherOpenInstalls(Device& device, DeviceOverview& overview) {
    std::set<std::string> open;
    if (overview.settings.coordination) {
        const Result<std::vector<CoordinatorRecord>> coordinators = device.coordinators();
        if (!coordinators) return unusable(coordinators.error());
        for (const CoordinatorRecord& each : *coordinators) {
            if (isOpenInstall(each)) open.insert(each.identifier);
        }
    } else {
        const Result<std::vector<ApplicationRecord>> records = device.applications();
        if (!records) return unusable(records.error());
        for (const ApplicationRecord& each : *records) {
            if (isOpenInstall(each)) open.insert(each.identifier);
        }
    }
    overview.open.assign(open.begin(), open.end());
    return {};
}

Status gatherSession(Device& device, DeviceOverview& overview) {
    const Result<SessionRecord> session = device.session();
    if (!session) return unusable(session.error());
    overview.session = *session;
    if (session->isUnderWay) return {};
    overview.staged = stagedWorkOn(device);
    return gatherOpenInstalls(device, overview);
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
        const std::size_t width = console.isTerminal ? console.width : 0;
        console.out << (asJson ? jsonText(*overview) + "\n" : overviewText(*overview, width));
        return {};
    });
}

}  // namespace appsync
