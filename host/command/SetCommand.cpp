#include <memory>
#include <ostream>
#include <string_view>
#include <utility>

#include "device/Device.h"
#include "device/values/DeviceError.h"
#include "host/command/Commands.h"
#include "host/command/IdentifierArgument.h"
#include "host/command/OpenDevice.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/session/PlugIn.h"
#include "platform/SyncClient.h"

namespace appsync {
namespace {

// Does something to one application of a device and says that it is done.
template <typename Action>
int actOn(const std::string& path, const std::string& identifier, const DeviceOpenOptions& options,
          std::string_view done, const Console& console, Action action) {
    const Status checked = checkIdentifier(identifier, kGiveAsShown);
    if (!checked) return console.fail(checked.error());
    const Result<std::unique_ptr<Device>> device = openDevice(path, options);
    if (!device) return console.fail(device.error());
    const Status status = action(**device);
    if (const auto broken = (*device)->databaseFailure()) return console.fail(unusable(*broken));
    if (!status) return console.fail(classified(status.error()));
    console.out << identifier << " " << done << '\n';
    return kExitDone;
}

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

int runCreate(const std::string& device, bool coordination, const Console& console) {
    if (device.empty()) {
        return console.fail(wrongUsage("cannot create a device at ''",
                                       "it is no path of a directory; give that of a new one"));
    }
    const Status created = Device::create(device, {coordination});
    if (!created) return console.fail(unusable(created.error()));
    console.out << printable(device) << " is an empty device\n";
    return kExitDone;
}

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

int runRun(const std::string& device, const std::string& identifier, const Console& console) {
    return actOn(device, identifier, {}, "runs", console,
                 [&](Device& opened) { return opened.run(identifier); });
}

int runQuit(const std::string& device, const std::string& identifier, const Console& console) {
    return actOn(device, identifier, {}, "does not run any more", console,
                 [&](Device& opened) { return opened.quit(identifier); });
}

int runUninstall(const std::string& device, const std::string& identifier, const Console& console) {
    return actOn(device, identifier, {.makesRoom = true}, "is uninstalled", console,
                 [&](Device& opened) { return opened.uninstall(identifier); });
}

int runDemote(const std::string& device, const std::string& identifier, bool bySystem,
              const Console& console) {
    const DemotedBy by = bySystem ? DemotedBy::System : DemotedBy::Person;
    const DeviceOpenOptions options{.access = DeviceAccess::Session, .makesRoom = true};
    return actOn(device, identifier, options, "is offloaded", console,
                 [&](Device& opened) { return opened.demote(identifier, by); });
}

int runReset(const std::string& device, const Console& console) {
    const Result<std::unique_ptr<Device>> opened =
        openDevice(device, {.access = DeviceAccess::Session, .makesRoom = true});
    if (!opened) return console.fail(opened.error());
    const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(**opened);
    if (!plugIn) return console.fail(plugIn.error());
    (*plugIn)->client().clearSyncData();
    if (const auto error = (*opened)->databaseFailure()) return console.fail(unusable(*error));
    console.out << printable(device) << " has forgotten what it kept for syncing\n";
    return kExitDone;
}

}  // namespace appsync
