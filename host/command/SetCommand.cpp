#include <memory>
#include <ostream>
#include <string_view>

#include "device/Device.h"
#include "host/command/Commands.h"
#include "host/command/OpenDevice.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"

namespace appsync {
namespace {

Result<PolicyAnswer> parsePolicy(const std::string& name, std::string_view value) {
    if (value == "yes") return PolicyAnswer::Yes;
    if (value == "no") return PolicyAnswer::No;
    if (value == "unset") return PolicyAnswer::Unset;
    return wrongUsage(name + " cannot be " + printable(value), "use yes, no or unset");
}

Status addCoordination(DeviceSettingsChange& change, std::string_view value) {
    if (value != "on" && value != "off") {
        return wrongUsage("coordination cannot be " + printable(value), "use on or off");
    }
    change.coordination = value == "on";
    return {};
}

Status addAssignment(DeviceSettingsChange& change, const std::string& assignment) {
    const std::size_t equals = assignment.find('=');
    const std::string name = assignment.substr(0, equals);
    const std::string value = equals == std::string::npos ? "" : assignment.substr(equals + 1);
    if (name == "coordination") return addCoordination(change, value);
    if (name != "installation" && name != "removal") {
        return wrongUsage("there is no setting " + printable(name),
                          "use installation=, removal= or coordination=");
    }
    const Result<PolicyAnswer> answer = parsePolicy(name, value);
    if (!answer) return answer.error();
    (name == "installation" ? change.installation : change.removal) = *answer;
    return {};
}

Result<DeviceSettingsChange> parseAssignments(const std::vector<std::string>& assignments) {
    DeviceSettingsChange change;
    for (const std::string& assignment : assignments) {
        const Status added = addAssignment(change, assignment);
        if (!added) return added.error();
    }
    return change;
}

// Without coordination no coordinator outlives the opening of a session; whoever turns it off hears
// whose goes.
int tellWhatEnds(Device& device, const Console& console) {
    const Result<std::vector<CoordinatorRecord>> ending = device.coordinators();
    if (!ending) return console.fail(unusable(ending.error()));
    if (ending->empty()) return kExitDone;
    console.out << "The next session gives up what has a coordinator:";
    for (const CoordinatorRecord& each : *ending) console.out << ' ' << printable(each.identifier);
    console.out << "\nTo keep it, turn coordination on again before that.\n";
    return kExitDone;
}

}  // namespace

int runSet(const std::string& device, const std::vector<std::string>& assignments,
           const Console& console) {
    const Result<DeviceSettingsChange> change = parseAssignments(assignments);
    if (!change) return console.fail(change.error());
    const Result<std::unique_ptr<Device>> opened = openDevice(device, DeviceAccess::Look);
    if (!opened) return console.fail(opened.error());
    const Status changed = (*opened)->change(*change);
    if (!changed) return console.fail(classified(changed.error()));
    return change->coordination == false ? tellWhatEnds(**opened, console) : kExitDone;
}

}  // namespace appsync
