#include "tests/reliability/DeviceState.h"

#include "client/Paths.h"
#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {

/// Property lists by what they say, whatever their encoding.
std::string textOfFile(World& world, const std::string& path) {
    if (path.ends_with(".plist")) {
        if (const auto list = world.platform.propertyListAt(path)) return callText(*list);
    }
    return world.platform.files.text(path).value_or("(directory)");
}

/// Without the packages that are no longer there: whoever reads it looks for them first.
std::string textOfRestoreState(World& world) {
    std::string text;
    const auto state = world.platform.propertyListAt(std::string(kRestoreStatePath));
    if (!state) return text;
    for (const PropertyList::Entry& application : state->entries()) {
        for (const PropertyList::Entry& version : application.value.entries()) {
            const std::string* path = version.value.findString("path");
            if (path == nullptr || !world.platform.files.exists(*path)) continue;
            text += application.key + " " + version.key + " at " + *path + "; ";
        }
    }
    return text;
}

bool belongsToLastSession(const std::string& path) {
    return path.starts_with(kTodoDirectory) || path.starts_with(kIconDirectory);
}

void addApplications(World& world, DeviceState& state) {
    const SimulatedAppRegistry& registry = world.platform.registry;
    for (const std::string& identifier : registry.installedIdentifiers()) {
        state["application " + identifier] =
            "version " + callText(registry.installed(identifier)->bundleVersion);
    }
    for (const std::string& identifier : registry.placeholderIdentifiers()) {
        const AppProxy placeholder = *registry.placeholder(identifier);
        state["placeholder " + identifier] = "version " + callText(placeholder.bundleVersion) +
                                             ", install type " + callText(placeholder.installType);
    }
}

void addCoordinators(World& world, DeviceState& state) {
    for (const std::string& identifier : world.platform.coordination.identifiers()) {
        const SimulatedCoordinatorState& found = *world.platform.coordination.state(identifier);
        state["coordinator " + identifier] =
            "kind " + callText(static_cast<int>(found.kind)) + ", of client " +
            callText(found.creator) + (found.appAsset != nullptr ? ", package" : "") +
            (found.userData != nullptr ? ", data" : "") +
            (found.placeholderShown ? ", placeholder" : "") + ", responsible client " +
            callText(found.responsibleClient);
    }
}

}  // namespace

DeviceState stateOf(World& world) {
    DeviceState state;
    addApplications(world, state);
    addCoordinators(world, state);
    state["icon layout"] = callText(PropertyList::strings(world.platform.homeScreen.layout()));
    state["uninstalled"] = callText(world.platform.installer.uninstalled());
    for (const std::string& path : world.platform.files.paths("/var")) {
        if (path == kRestoreStatePath || belongsToLastSession(path)) continue;
        state[path] = textOfFile(world, path);
    }
    state["packages that wait for data"] = textOfRestoreState(world);
    return state;
}

std::vector<std::string> differencesBetween(const DeviceState& expected, const DeviceState& found) {
    std::vector<std::string> lines;
    for (const auto& [name, value] : expected) {
        const auto other = found.find(name);
        if (other == found.end()) {
            lines.push_back(name + " is missing");
        } else if (other->second != value) {
            lines.push_back(name + " is " + other->second + " instead of " + value);
        }
    }
    for (const auto& [name, value] : found) {
        if (!expected.contains(name)) lines.push_back(name + " is there: " + value);
    }
    return lines;
}

}  // namespace appsync
