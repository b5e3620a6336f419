#include "tests/reliability/Demands.h"

#include <algorithm>

#include "client/Paths.h"
#include "client/TodoList.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {
namespace {

constexpr const char* kPackageVersion = "1.0";

bool isOffloaded(const AppProxy& placeholder) {
    return placeholder.installType == kInstallTypeDowngrade ||
           placeholder.installType == kInstallTypeIntentionalDowngrade;
}

}  // namespace

void Demands::demand(bool isDone, const std::string& otherwise) {
    ++count_;
    if (!isDone) invariants_.violate(otherwise);
}

void Demands::restored(const std::vector<std::string>& identifiers) {
    if (world_.coordinated) mayBePlaced_.insert(identifiers.begin(), identifiers.end());
    if (!isDemanding()) return;
    for (const std::string& identifier : identifiers) {
        if (leftOut_.contains(identifier)) continue;
        const bool isThere = world_.platform.registry.installed(identifier) ||
                             world_.platform.registry.placeholder(identifier);
        const bool isUnderWay = world_.platform.coordination.placeholder(identifier) != nullptr;
        demand(world_.coordinated ? isUnderWay : isThere, identifier + " was not restored");
    }
}

void Demands::willReconcile(const PropertyList& list) {
    for (const std::string& identifier : identifiersToRemove(list)) {
        removed_.insert(identifier);
        if (world_.platform.registry.placeholder(identifier)) placed_.insert(identifier);
    }
}

void Demands::willAsk() {
    wanted_.clear();
    for (const std::string& identifier : listedToInstall()) {
        if (isFree(identifier)) wanted_.insert(identifier);
    }
}

std::set<std::string> Demands::listedToInstall() const {
    std::set<std::string> identifiers;
    const auto list = world_.platform.propertyListAt(std::string(kTodoListPath));
    if (!list) return identifiers;
    for (const PropertyList& entry : list->elements()) {
        if (hasOperation(entry, kTodoInstall)) {
            identifiers.insert(*entry.findString(kTodoIdentifierKey));
        }
    }
    return identifiers;
}

/// Whether nothing stands in the way of its install.
bool Demands::isFree(const std::string& identifier) const {
    if (leftOut_.contains(identifier)) return false;
    const auto placeholder = world_.platform.registry.placeholder(identifier);
    if (!world_.coordinated) return !placeholder;
    // What an earlier session has begun to remove may go at any moment.
    if (removed_.contains(identifier)) return false;
    if (world_.platform.coordination.state(identifier) != nullptr) return false;
    return !placeholder || isOffloaded(*placeholder);
}

void Demands::wereAskedFor(const std::vector<SyncAssetPointer>& assets) {
    if (world_.coordinated) {
        for (const SyncAssetPointer& asset : assets) mayBePlaced_.insert(asset->identifier);
    }
    if (!isDemanding() || !allowsInstalls_) return;
    const std::set<std::string> listed = listedToInstall();
    for (const std::string& identifier : wanted_) {
        // An install of an earlier session has been told of meanwhile: the entry is done with.
        if (!listed.contains(identifier)) continue;
        const bool isAskedFor =
            std::any_of(assets.begin(), assets.end(), [&identifier](const SyncAssetPointer& asset) {
                return asset->identifier == identifier;
            });
        demand(isAskedFor, identifier + " was not asked for");
    }
}

/// What an earlier session has delivered may be given up with it.
void Demands::notDelivered(const std::string& identifier) {
    if (delivered_.contains(identifier)) leaveOut(identifier);
}

void Demands::sessionHasEnded() {
    if (!isDemanding()) return;
    const SimulatedAppRegistry& registry = world_.platform.registry;
    for (const std::string& identifier : delivered_) {
        if (leftOut_.contains(identifier) || removed_.contains(identifier)) continue;
        const auto application = registry.installed(identifier);
        demand(application && application->bundleVersion == kPackageVersion,
               identifier + " has arrived and is not installed");
    }
    if (!allowsRemovals_) return;
    for (const std::string& identifier : removed_) {
        if (delivered_.contains(identifier) || placed_.contains(identifier)) continue;
        if (mayBePlaced_.contains(identifier)) continue;
        demand(!registry.installed(identifier), identifier + " was to be removed and is there");
    }
}

}  // namespace appsync
