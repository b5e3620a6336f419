#include "host/plan/StandingInstalls.h"

#include <algorithm>
#include <map>
#include <string_view>

#include "client/Paths.h"
#include "device/Device.h"
#include "device/package/PackageReader.h"
#include "device/values/DeviceError.h"
#include "device/values/PackageIdentifier.h"
#include "host/plan/SyncPlan.h"
#include "system/file/RootDirectory.h"

namespace appsync {
namespace {

constexpr std::string_view kPackagePromiseSuffix = "-Asset";
constexpr std::string_view kUpdating = "updating";

bool hasPackage(const CoordinatorRecord& coordinator) {
    return std::any_of(coordinator.promises.begin(), coordinator.promises.end(),
                       [](const PromiseRecord& promise) {
                           return promise.complete && !promise.cancelled &&
                                  promise.name.ends_with(kPackagePromiseSuffix);
                       });
}

class TakingUp {
  public:
    TakingUp(SyncPlan& plan, const std::vector<ApplicationRecord>& present,
             const StandingRules& rules)
        : plan_(plan), rules_(rules) {
        for (const ApplicationRecord& record : present) {
            if (record.isPlaceholder) continue;
            installed_[record.identifier] = record.version.value_or("");
        }
    }

    void add(const CoordinatorRecord& coordinator) {
        if (coordinator.client != SyncClientID) return leaveTo(coordinator);
        if (coordinator.restores()) return addRestored(coordinator);
        if (!goesOn(coordinator)) {
            standing_.obsolete.push_back(coordinator.identifier);
        } else if (hasPackage(coordinator)) {
            standing_.arrived.insert(coordinator.identifier);
            if (PlannedInstall* planned = find(coordinator.identifier)) {
                planned->hasArrived = true;
                planned->isInstalledUnasked = coordinator.isComplete;
                if (!planned->doubt.empty()) planned->newVersion = versionOf(planned->identifier);
            } else if (coordinator.isComplete) {
                addLeftOver(coordinator.identifier);
            }
        }
    }

    StandingInstalls take() { return std::move(standing_); }

  private:
    PlannedInstall* find(const std::string& identifier) {
        for (auto* installs : {&plan_.install, &plan_.update}) {
            const auto found = std::find_if(
                installs->begin(), installs->end(),
                [&](const PlannedInstall& each) { return each.identifier == identifier; });
            if (found != installs->end()) return &*found;
        }
        return nullptr;
    }

    bool goesOn(const CoordinatorRecord& coordinator) {
        if (rules_.isForbidden) return false;
        const std::string& identifier = coordinator.identifier;
        const bool isUpdate = installed_.contains(identifier);
        if (isUpdate != (coordinator.kind == kUpdating)) return false;
        if (isToBeRemoved(identifier)) return false;
        const PlannedInstall* planned = find(identifier);
        if (planned == nullptr) return rules_.leavesOthers && hasPackage(coordinator);
        return !hasPackage(coordinator) || isAskedFor(*planned);
    }

    // Of a package that has arrived. Where the library has no good one, any version is as good.
    [[nodiscard]] bool isAskedFor(const PlannedInstall& planned) const {
        const std::optional<std::string> arrived = rules_.arrivedVersion(planned.identifier);
        return arrived && (!planned.doubt.empty() || *arrived == planned.newVersion);
    }

    [[nodiscard]] bool isToBeRemoved(const std::string& identifier) const {
        return std::ranges::find(plan_.remove, identifier) != plan_.remove.end();
    }

    [[nodiscard]] std::string versionOf(const std::string& identifier) const {
        return rules_.arrivedVersion(identifier).value_or("");
    }

    void addRestored(const CoordinatorRecord& coordinator) {
        const std::string& identifier = coordinator.identifier;
        if (!coordinator.placeholderStands) {
            if (find(identifier) != nullptr) standing_.obsolete.push_back(identifier);
        } else if (coordinator.isComplete && hasPackage(coordinator) &&
                   !isToBeRemoved(identifier)) {
            standing_.arrived.insert(identifier);
            addLeftOver(identifier);
            unskip(identifier);
        }
    }

    // What the library holds in the version that comes is not left alone any more.
    void unskip(const std::string& identifier) {
        if (!rules_.libraryVersion || rules_.libraryVersion(identifier) != versionOf(identifier)) {
            return;
        }
        std::erase_if(plan_.skipped,
                      [&](const PlannedSkip& each) { return each.identifier == identifier; });
    }

    void addLeftOver(const std::string& identifier) {
        PlannedInstall planned;
        planned.identifier = identifier;
        planned.newVersion = versionOf(identifier);
        planned.hasArrived = planned.isInstalledUnasked = planned.isLeftOver = true;
        const auto installed = installed_.find(identifier);
        const bool isUpdate = installed != installed_.end();
        if (isUpdate) planned.oldVersion = installed->second;
        (isUpdate ? plan_.update : plan_.install).push_back(std::move(planned));
    }

    void leaveTo(const CoordinatorRecord& coordinator) {
        if (find(coordinator.identifier) == nullptr) return;
        for (auto* installs : {&plan_.install, &plan_.update}) {
            std::erase_if(*installs, [&](const PlannedInstall& each) {
                return each.identifier == coordinator.identifier;
            });
        }
        plan_.skipped.push_back({coordinator.identifier,
                                 heldSentence(coordinator.identifier, coordinator.client), true});
    }

    SyncPlan& plan_;
    const StandingRules& rules_;
    std::map<std::string, std::string> installed_;  // versions
    StandingInstalls standing_;
};

}  // namespace

std::string heldSentence(const std::string& identifier, CoordinationClient client) {
    return "client " + std::to_string(client) +
           " of the coordination service has its install in hand: wait for that, or cancel it "
           "(appsync coordinator DEVICE cancel " +
           identifier + ")";
}

std::optional<std::string> versionOfArrived(Device& device, const std::string& identifier) {
    const std::string path = std::string(kPublicStaging) + "/" + archiveNameOf(identifier);
    const Result<RegularFile> file = device.root().openRegularFile(path);
    if (!file) return std::nullopt;
    const Result<PackageReader> package =
        PackageReader::open(file->descriptor.get(), path, device.propertyLists());
    if (!package || package->info().identifier != identifier) return std::nullopt;
    return package->info().version;
}

StandingInstalls takeUp(SyncPlan& plan, const std::vector<CoordinatorRecord>& coordinators,
                        const std::vector<ApplicationRecord>& present, const StandingRules& rules) {
    TakingUp takingUp(plan, present, rules);
    for (const CoordinatorRecord& coordinator : coordinators) takingUp.add(coordinator);
    return takingUp.take();
}

Status cancelObsolete(Device& device, const StandingInstalls& standing) {
    for (const std::string& identifier : standing.obsolete) {
        Status cancelled = device.cancelCoordinator(identifier, SyncClientID);
        if (!cancelled && cancelled.error().domain == kDeviceErrorDomain) return cancelled;
    }
    return {};
}

}  // namespace appsync
