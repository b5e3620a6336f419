#include <algorithm>
#include <map>
#include <memory>
#include <ostream>
#include <string>
#include <string_view>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/change/ChangeCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {
namespace {

Result<PolicyAnswer> parsePolicy(const std::string& name, const std::string& value) {
    if (value == "yes") return PolicyAnswer::Yes;
    if (value == "no") return PolicyAnswer::No;
    if (value == "unset") return PolicyAnswer::Unset;
    return wrongUsage(name + " cannot be " + shownArgument(value), "use yes, no or unset");
}

Status addCoordination(DeviceSettingsChange& change, const std::string& value) {
    if (value != "on" && value != "off") {
        return wrongUsage("coordination cannot be " + shownArgument(value), "use on or off");
    }
    change.coordination = value == "on";
    return {};
}

std::string nameIn(const std::string& assignment) {
    return assignment.substr(0, assignment.find('='));
}

Status addAssignment(DeviceSettingsChange& change, const std::string& assignment) {
    const std::size_t equals = assignment.find('=');
    const std::string name = nameIn(assignment);
    const std::string value = equals == std::string::npos ? "" : assignment.substr(equals + 1);
    const bool isKnown = name == "coordination" || name == "installation" || name == "removal";
    if (isKnown && equals == std::string::npos) {
        return wrongUsage(name + " has no value", "use " + name + "=VALUE");
    }
    if (name == "coordination") return addCoordination(change, value);
    if (!isKnown) {
        return wrongUsage("there is no setting " + shownArgument(name),
                          "use installation=, removal= or coordination=");
    }
    const Result<PolicyAnswer> answer = parsePolicy(name, value);
    if (!answer) return answer.error();
    (name == "installation" ? change.installation : change.removal) = *answer;
    return {};
}

Result<DeviceSettingsChange> parseAssignments(const std::vector<std::string>& assignments) {
    DeviceSettingsChange change;
    std::map<std::string, std::string> given;
    for (const std::string& assignment : assignments) {
        const Status added = addAssignment(change, assignment);
        if (!added) return added.error();
        const std::string& first = given.emplace(nameIn(assignment), assignment).first->second;
        if (first != assignment) {
            std::string both = "both ";
            both.append(first).append(" and ").append(assignment).append(" are given");
            return wrongUsage(both, "choose one");
        }
    }
    return change;
}

std::string_view nameOf(PolicyAnswer answer) {
    if (answer == PolicyAnswer::Unset) return "unset";
    return answer == PolicyAnswer::Yes ? "yes" : "no";
}

bool areSame(const DeviceSettings& left, const DeviceSettings& right) {
    return left.installation == right.installation && left.removal == right.removal &&
           left.coordination == right.coordination;
}

struct ChangedSettings {
    DeviceSettings now;
    bool hasChanged = false;
    /// Whose coordinators the next session gives up.
    std::vector<std::string> ends;
    /// What a restore has left that the store brings from now on.
    std::vector<std::string> storeBrings;
};

bool isRestoredWithoutCoordinator(const ApplicationRecord& record,
                                  const std::vector<CoordinatorRecord>& coordinators) {
    return record.isPlaceholder && record.installType == kInstallTypeRestore &&
           std::ranges::none_of(coordinators, [&](const CoordinatorRecord& each) {
               return each.identifier == record.identifier;
           });
}

Result<std::vector<std::string>> whatTheStoreBrings(
    Device& device, const std::vector<CoordinatorRecord>& coordinators) {
    const Result<std::vector<ApplicationRecord>> records = device.applications();
    if (!records) return unusable(records.error());
    std::vector<std::string> identifiers;
    for (const ApplicationRecord& each : *records) {
        if (isRestoredWithoutCoordinator(each, coordinators)) {
            identifiers.push_back(each.identifier);
        }
    }
    return identifiers;
}

// Without coordination no coordinator outlives the opening of a session. Whoever turns it off hears
// whose goes, and whoever turns it on who brings what a restore has left.
Result<ChangedSettings> changeSettings(Device& device, const DeviceSettingsChange& change) {
    const Result<DeviceSettings> before = device.settings();
    if (!before) return unusable(before.error());
    const Status changed = device.change(change);
    if (!changed) return classified(changed.error());
    const Result<DeviceSettings> now = device.settings();
    if (!now) return unusable(now.error());
    ChangedSettings result{*now, !areSame(*before, *now), {}, {}};
    if (!change.coordination) return result;
    const Result<std::vector<CoordinatorRecord>> coordinators = device.coordinators();
    if (!coordinators) return unusable(coordinators.error());
    if (*change.coordination) {
        Result<std::vector<std::string>> brought = whatTheStoreBrings(device, *coordinators);
        if (!brought) return brought.error();
        result.storeBrings = *std::move(brought);
    } else {
        for (const CoordinatorRecord& each : *coordinators) result.ends.push_back(each.identifier);
    }
    return result;
}

void printSettingsJson(const ChangedSettings& settings, const Console& console) {
    console.out << indented({{"installation", nameOf(settings.now.installation)},
                             {"removal", nameOf(settings.now.removal)},
                             {"coordination", settings.now.coordination ? "on" : "off"},
                             {"changed", settings.hasChanged},
                             {"ends", settings.ends},
                             {"storeBrings", settings.storeBrings}})
                << '\n';
}

void printSettings(const std::string& device, const ChangedSettings& settings,
                   const Console& console) {
    console.out << printable(device) << (settings.hasChanged ? " is set: " : " was so already: ")
                << "installation=" << nameOf(settings.now.installation)
                << " removal=" << nameOf(settings.now.removal)
                << " coordination=" << (settings.now.coordination ? "on" : "off") << '\n';
    if (!settings.storeBrings.empty()) {
        console.out << "What a restore brought back comes from the store from now on:";
        for (const std::string& each : settings.storeBrings) console.out << ' ' << printable(each);
        console.out << "\nSee appsync store.\n";
    }
    if (settings.ends.empty()) return;
    console.out << "The next session gives up what has a coordinator:";
    for (const std::string& each : settings.ends) console.out << ' ' << printable(each);
    console.out << "\nTo keep it, turn coordination on again before that.\n";
}

}  // namespace

int runSet(const std::string& device, const std::vector<std::string>& assignments, bool asJson,
           const Console& console) {
    const Result<DeviceSettingsChange> change = parseAssignments(assignments);
    if (!change) return console.fail(change.error());
    const Result<std::unique_ptr<Device>> opened = openDevice(device, {.borrowsRoom = true});
    if (!opened) return console.fail(opened.error());
    const Result<ChangedSettings> settings = changeSettings(**opened, *change);
    if (!settings) return console.fail(settings.error());
    if (asJson) {
        printSettingsJson(*settings, console);
    } else {
        printSettings(device, *settings, console);
    }
    return kExitDone;
}

}  // namespace appsync
