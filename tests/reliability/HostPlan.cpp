#include "tests/reliability/HostPlan.h"

#include <algorithm>
#include <optional>
#include <utility>
#include <vector>

#include "client/Paths.h"
#include "client/TodoList.h"
#include "device/database/CoordinationTables.h"
#include "device/values/DeviceRecords.h"
#include "host/plan/Library.h"
#include "host/plan/StagingArea.h"
#include "host/plan/StandingInstalls.h"
#include "host/plan/SyncPlan.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {
namespace {

ErrorRecord cancelledByHost() { return ErrorRecord::make("Host", 1, "no longer wanted"); }

Library libraryOf(const PropertyList& wanted) {
    Library library;
    for (const PropertyList& entry : wanted.elements()) {
        if (!hasOperation(entry, kTodoInstall)) continue;
        library.packages.push_back({*entry.findString(kTodoIdentifierKey),
                                    *entry.findString(kTodoVersionKey),
                                    *entry.findString(kTodoNameKey), "", 1, 1});
    }
    std::sort(library.packages.begin(), library.packages.end(),
              [](const auto& a, const auto& b) { return a.identifier < b.identifier; });
    return library;
}

ApplicationRecord recordOf(const AppProxy& proxy) {
    ApplicationRecord record;
    record.identifier = proxy.applicationIdentifier;
    record.version = proxy.bundleVersion;
    record.isPlaceholder = proxy.state.placeholder;
    record.type = proxy.applicationType;
    record.installType = proxy.installType;
    return record;
}

std::vector<ApplicationRecord> presentOn(const World& world) {
    std::vector<ApplicationRecord> present;
    const SimulatedAppRegistry& registry = world.platform.registry;
    for (const std::string& identifier : registry.installedIdentifiers()) {
        present.push_back(recordOf(*registry.installed(identifier)));
    }
    for (const std::string& identifier : registry.placeholderIdentifiers()) {
        present.push_back(recordOf(*registry.placeholder(identifier)));
    }
    return present;
}

std::vector<CoordinatorRecord> coordinatorsOn(const World& world) {
    std::vector<CoordinatorRecord> coordinators;
    for (const std::string& identifier : world.platform.coordination.identifiers()) {
        const SimulatedCoordinatorState& state = *world.platform.coordination.state(identifier);
        CoordinatorRecord record;
        record.identifier = identifier;
        record.kind = nameOf(state.kind);
        record.client = state.creator;
        if (state.appAsset != nullptr) {
            record.promises.push_back({state.appAsset->name, state.appAsset->complete,
                                       state.appAsset->percent, state.appAsset->client,
                                       state.appAsset->cancelled.has_value()});
        }
        record.hasPlaceholder = state.placeholder != nullptr;
        record.placeholderStands = state.placeholderShown;
        record.isComplete = world.platform.coordination.isComplete(identifier);
        coordinators.push_back(std::move(record));
    }
    return coordinators;
}

/// A simulated package says nothing: its version is the one that was asked for, which the
/// placeholder shows.
std::optional<std::string> versionOfArrivedOn(const World& world, const std::string& identifier) {
    const SimulatedCoordinatorState* state = world.platform.coordination.state(identifier);
    if (state == nullptr || state->appAsset == nullptr || !state->appAsset->path) return {};
    if (!world.platform.files.contents(state->appAsset->path->path())) return {};
    if (state->placeholder == nullptr || !state->placeholder->attributes) return {};
    return state->placeholder->attributes->bundleVersion;
}

/// Those without a coordinator that goes on with them.
void removeLeftoverPlaceholders(World& world) {
    SimulatedAppRegistry& registry = world.platform.registry;
    for (const std::string& identifier : registry.placeholderIdentifiers()) {
        const bool isOfSync = registry.placeholder(identifier)->installType == kInstallTypeSync;
        if (!isOfSync || world.platform.coordination.state(identifier) != nullptr) continue;
        registry.hidePlaceholder(identifier);
    }
}

std::set<std::string> packagesThatWait(World& world, const std::set<std::string>& arrived) {
    std::set<std::string> paths;
    for (const std::string& identifier : arrived) paths.insert(World::packagePath(identifier));
    const auto state = world.platform.propertyListAt(std::string(kRestoreStatePath));
    if (!state) return paths;
    for (const PropertyList::Entry& application : state->entries()) {
        for (const PropertyList::Entry& version : application.value.entries()) {
            if (const std::string* path = version.value.findString("path")) paths.insert(*path);
        }
    }
    return paths;
}

void removeStalePackages(World& world, const std::set<std::string>& arrived) {
    const std::set<std::string> waiting = packagesThatWait(world, arrived);
    for (const std::string& name : world.platform.files.names(std::string(kPublicStaging))) {
        const std::string path = std::string(kPublicStaging) + "/" + name;
        if (name.ends_with(".zip") && !waiting.contains(path)) world.platform.files.remove(path);
    }
}

}  // namespace

HostPlan planSession(World& world, const PropertyList& wanted) {
    const Library library = libraryOf(wanted);
    PlanOptions options;
    options.remove = identifiersToRemove(wanted);
    options.bringsOffloaded = world.coordinated;
    const std::vector<ApplicationRecord> present = presentOn(world);
    SyncPlan plan = makePlan(library, present, options);
    StandingInstalls standing;
    StandingRules rules;
    rules.arrivedVersion = [&world](const std::string& identifier) {
        return versionOfArrivedOn(world, identifier);
    };
    if (world.coordinated) standing = takeUp(plan, coordinatorsOn(world), present, rules);
    for (const std::string& identifier : standing.obsolete) {
        world.platform.coordination.cancel(identifier, cancelledByHost(), SyncClientID);
    }
    removeLeftoverPlaceholders(world);
    removeStalePackages(world, standing.arrived);
    return {todoListOf(plan), std::move(standing.arrived)};
}

void cancelWhatWasTakenUp(World& world, const HostPlan& plan) {
    for (const std::string& identifier : plan.arrived) {
        const auto* state = world.platform.coordination.state(identifier);
        if (state == nullptr || state->creator != SyncClientID) continue;
        if (world.platform.coordination.isComplete(identifier)) continue;
        world.platform.coordination.cancel(identifier, cancelledByHost(), SyncClientID);
    }
}

}  // namespace appsync
