#include "host/plan/SyncPlan.h"

#include <algorithm>
#include <map>
#include <set>
#include <string_view>
#include <utility>

#include "client/TodoList.h"
#include "device/values/DeviceRecords.h"
#include "device/values/PackageIdentifier.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/plan/Library.h"
#include "host/plan/Versions.h"
#include "platform/AppRegistry.h"
#include "platform/InstallProgressRecord.h"
#include "platform/PropertyList.h"

namespace appsync {
namespace {

// One identifier's records together: the application, and the placeholder that may stand for it.
struct Present {
    const ApplicationRecord* application = nullptr;
    const ApplicationRecord* placeholder = nullptr;

    [[nodiscard]] const ApplicationRecord& any() const {
        return application ? *application : *placeholder;
    }
    [[nodiscard]] bool isSystem() const { return any().type == kApplicationTypeSystem; }
};

using PresentByIdentifier = std::map<std::string, Present, std::less<>>;

// The placeholder of a sync stands for nothing: it is cleared before the session begins.
bool isOfSync(const ApplicationRecord& record) {
    return record.isPlaceholder && record.installType == kInstallTypeSync;
}

PresentByIdentifier byIdentifier(const std::vector<ApplicationRecord>& present) {
    PresentByIdentifier result;
    for (const ApplicationRecord& record : present) {
        if (isOfSync(record)) continue;
        Present& entry = result[record.identifier];
        (record.isPlaceholder ? entry.placeholder : entry.application) = &record;
    }
    return result;
}

bool isOffloaded(const ApplicationRecord& placeholder) {
    return placeholder.installType == kInstallTypeDowngrade ||
           placeholder.installType == kInstallTypeIntentionalDowngrade;
}

std::string commandToSend(const ApplicationRecord& placeholder) {
    return "appsync send DEVICE " + placeholder.identifier + " FILE";
}

std::string whyNot(
    const Present& present, bool isStoreBringing,
    const std::function<std::string(const std::string& identifier)>& howRestoredComes) {
    if (present.isSystem()) {
        const bool comesBack = present.placeholder != nullptr && isOffloaded(*present.placeholder);
        return comesBack ? "it belongs to the system, and is offloaded: " +
                               commandToSend(*present.placeholder) + " brings it back"
                         : "it belongs to the system";
    }
    if (isOffloaded(*present.placeholder)) {
        return "it is offloaded on the device: " + commandToSend(*present.placeholder) +
               " brings it back";
    }
    if (present.placeholder->installType == kInstallTypeRestore) {
        if (isStoreBringing) {
            return "a restore brought it back, and its package is the store's to bring: see "
                   "appsync store";
        }
        const std::string& identifier = present.placeholder->identifier;
        return "a restore brought it back: " +
               (howRestoredComes
                    ? howRestoredComes(identifier)
                    : commandToSend(*present.placeholder) + " --restore brings its package");
    }
    return "another install of it is under way on the device";
}

PlannedInstall plannedInstall(const LibraryPackage& package, std::string oldVersion) {
    PlannedInstall planned{package.identifier, package.name,  std::move(oldVersion),
                           package.version,    package.bytes, package.unpackedBytes};
    planned.file = package.file;
    return planned;
}

class Planner {
  public:
    Planner(const Library& library, const std::vector<ApplicationRecord>& present,
            const PlanOptions& options)
        : library_(library),
          options_(options),
          present_(byIdentifier(present)),
          chosen_(options.only.begin(), options.only.end()) {}

    SyncPlan make() {
        plan_.notes = library_.notes;
        failLacking();
        if (options_.only.empty() || !plan_.failed.empty()) failFaults();
        for (const std::string& identifier : options_.remove) removeNamed(identifier);
        for (const LibraryPackage& package : library_.packages) bringInStep(package);
        if (options_.mirror) removeWhatLibraryLacks();
        return std::move(plan_);
    }

  private:
    void failLacking() {
        for (const std::string& identifier : chosen_) {
            if (library_.find(identifier) != nullptr) continue;
            plan_.failed.push_back(
                {identifier, "the library has no package of it: put one into " + library_.folder});
        }
    }

    // Any of them may be what is lacking.
    void failFaults() {
        for (const LibraryFault& fault : library_.faults) {
            plan_.failed.push_back({fault.fileName, fault.error});
        }
    }

    void removeNamed(const std::string& identifier) {
        if (!named_.insert(identifier).second) return;
        const auto found = present_.find(identifier);
        if (found == present_.end()) {
            skip(identifier, "it is not on the device", false);
        } else if (found->second.isSystem()) {
            skip(identifier, "it belongs to the system", true);
        } else {
            remove(identifier, found->second);
        }
    }

    void bringInStep(const LibraryPackage& package) {
        if (named_.contains(package.identifier)) return;
        if (!chosen_.empty() && !chosen_.contains(package.identifier)) return;
        const auto found = present_.find(package.identifier);
        if (found == present_.end()) {
            plan_.install.push_back(plannedInstall(package, {}));
            return;
        }
        const Present& present = found->second;
        const bool isAskedFor = options_.bringsOffloaded && !present.isSystem() &&
                                present.placeholder != nullptr && isOffloaded(*present.placeholder);
        if (isAskedFor) {
            plan_.install.push_back(plannedInstall(package, {}));
        } else if (present.isSystem() || present.placeholder != nullptr) {
            skip(package.identifier,
                 whyNot(present, options_.bringsOffloaded, options_.howRestoredComes), true);
        } else if (present.application->version.value_or("") != package.version) {
            plan_.update.push_back(
                plannedInstall(package, present.application->version.value_or("")));
        }
    }

    void removeWhatLibraryLacks() {
        for (const auto& [identifier, present] : present_) {
            if (present.isSystem() || named_.contains(identifier)) continue;
            if (library_.find(identifier) != nullptr) continue;
            if (present.application == nullptr && !isOffloaded(*present.placeholder)) continue;
            if (library_.faults.empty()) {
                remove(identifier, present);
            } else {
                // An unreadable package may be this very application's.
                skip(identifier, "it is kept while the library holds what cannot be read", true);
            }
        }
    }

    void remove(const std::string& identifier, const Present& present) {
        plan_.remove.push_back(identifier);
        plan_.reclaimed += present.any().bytes;
    }

    void skip(const std::string& identifier, std::string why, bool isUnmet) {
        plan_.skipped.push_back({identifier, std::move(why), isUnmet});
    }

    const Library& library_;
    const PlanOptions& options_;
    const PresentByIdentifier present_;
    const std::set<std::string> chosen_;
    std::set<std::string> named_;
    SyncPlan plan_;
};

// An entry of a todo list.
struct AskedInstall {
    std::string identifier;
    std::string version;  // empty where it tells none
};

// Plans what a todo list asks for; the list may be hostile.
class StagedPlanner {
  public:
    StagedPlanner(const std::vector<ApplicationRecord>& present, const StagedPlanOptions& options)
        : options_(options), present_(byIdentifier(present)) {}

    // The device removes before it asks for anything, in whatever order the entries stand.
    SyncPlan make(const PropertyList& todoList) {
        std::size_t number = 0;
        plan_.bringsInStep = false;
        for (const PropertyList& entry : todoList.elements()) add(entry, ++number);
        for (const AskedInstall& each : asked_) install(each);
        warnOfOtherVersions();
        return std::move(plan_);
    }

  private:
    void add(const PropertyList& entry, std::size_t number) {
        const std::string entryName = "entry " + std::to_string(number) + " of the todo list";
        if (!entry.isMap()) return fail(entryName, "it is not a map");
        const std::string* operation = entry.findString(kTodoOperationKey);
        if (operation == nullptr) return fail(entryName, "it has no operation");
        const bool isInstall = *operation == kTodoInstall;
        if (!isInstall && *operation != kTodoRemove) return;
        const std::string* identifier = entry.findString(kTodoIdentifierKey);
        if (identifier == nullptr) return fail(entryName, "its identifier is not a string");
        if (!isLegalIdentifier(*identifier)) {
            return fail(identifier->empty() ? entryName : *identifier,
                        "it is not a legal identifier: " + std::string(kIdentifierRule));
        }
        if (isInstall) {
            if (!installs_.insert(*identifier).second) return;
            const std::string* version = entry.findString(kTodoVersionKey);
            asked_.push_back({*identifier, version != nullptr ? *version : ""});
        } else {
            remove(*identifier);
        }
    }

    void install(const AskedInstall& asked) {
        const std::string& identifier = asked.identifier;
        const auto found = present_.find(identifier);
        const bool isThere = found != present_.end() && !removals_.contains(identifier);
        if (isThere && isNotAskedFor(found->second)) {
            plan_.skipped.push_back(
                {identifier,
                 whyNot(found->second, options_.bringsOffloaded, options_.howRestoredComes), true});
            return;
        }
        const bool isInstalled = found != present_.end() && found->second.application != nullptr;
        const std::string oldVersion =
            isInstalled ? found->second.application->version.value_or("") : "";
        const bool isUpdate = isThere && isInstalled;
        PlannedInstall install = planned(identifier, oldVersion);
        holdAgainstStaged(install, asked.version, isUpdate);
        (isUpdate ? plan_.update : plan_.install).push_back(std::move(install));
    }

    // The library may have changed since, or be another one. What the device has already is not
    // sent in place of what it is to have; anything else comes, and is told of.
    void holdAgainstStaged(PlannedInstall& install, const std::string& listed, bool isUpdate) {
        if (!install.doubt.empty() || !options_.stagedVersionOf) return;
        const std::optional<std::string> staged = options_.stagedVersionOf(install.identifier);
        const std::string& offered = install.newVersion;
        if (!staged || offered.empty() || *staged == offered || listed == offered) return;
        const std::string asked = listed.empty() ? *staged : listed;
        const std::string what =
            "the staging area asks for version " + asked + ", the library has " + offered;
        if (isUpdate && install.oldVersion == offered) {
            install.refusal = what + ", which is on the device already: put version " + asked +
                              " into the library, or stage again (appsync stage DEVICE LIBRARY)";
            install.doubt = install.refusal;
        } else {
            otherVersions_.push_back(install.identifier + " " + offered + " instead of " + asked);
        }
    }

    void warnOfOtherVersions() {
        if (otherVersions_.empty()) return;
        constexpr std::size_t kNamed = 5;
        const std::size_t named = std::min(otherVersions_.size(), kNamed);
        std::string text =
            "the library has other versions than the staging area asks for, which come: ";
        for (std::size_t index = 0; index < named; ++index) {
            text += (index == 0 ? "" : ", ") + otherVersions_[index];
        }
        if (otherVersions_.size() > named) {
            text += " and " + std::to_string(otherVersions_.size() - named) + " more";
        }
        plan_.warnings.push_back(std::move(text));
    }

    // The device leaves alone what has a placeholder that is not of a sync.
    [[nodiscard]] bool isNotAskedFor(const Present& present) const {
        if (present.placeholder == nullptr) return false;
        return present.isSystem() || !options_.bringsOffloaded ||
               !isOffloaded(*present.placeholder);
    }

    [[nodiscard]] PlannedInstall planned(const std::string& identifier,
                                         const std::string& oldVersion) const {
        const Result<LibraryPackage> package = options_.packageOf(identifier);
        if (package) return plannedInstall(*package, oldVersion);
        PlannedInstall planned;
        planned.identifier = identifier;
        planned.oldVersion = oldVersion;
        planned.doubt = package.error().description();
        return planned;
    }

    void remove(const std::string& identifier) {
        if (!removals_.insert(identifier).second) return;
        const auto found = present_.find(identifier);
        if (found == present_.end()) {
            plan_.skipped.push_back({identifier, "it is not on the device", false});
            return;
        }
        plan_.remove.push_back(identifier);
        plan_.reclaimed += found->second.any().bytes;
    }

    void fail(std::string identifier, std::string error) {
        plan_.failed.push_back({std::move(identifier), std::move(error)});
    }

    const StagedPlanOptions& options_;
    const PresentByIdentifier present_;
    std::vector<AskedInstall> asked_;  // to install, in the order of the list
    std::set<std::string> installs_;   // the same
    std::vector<std::string> otherVersions_;
    std::set<std::string> removals_;
    SyncPlan plan_;
};

template <typename Number>
std::uint64_t total(const SyncPlan& plan, Number number) {
    std::uint64_t sum = 0;
    for (const PlannedInstall& each : plan.install) sum += number(each);
    for (const PlannedInstall& each : plan.update) sum += number(each);
    return sum;
}

// What has arrived needs no package.
bool isDoubtful(const PlannedInstall& each) { return !each.doubt.empty() && !each.hasArrived; }

}  // namespace

bool PlannedInstall::isDowngrade() const {
    return !oldVersion.empty() && !newVersion.empty() &&
           compareVersions(newVersion, oldVersion) < 0;
}

std::uint64_t SyncPlan::bytes() const {
    return total(*this,
                 [](const PlannedInstall& each) { return each.hasArrived ? 0 : each.bytes; });
}

std::uint64_t SyncPlan::needed() const {
    return bytes() + total(*this, [](const PlannedInstall& each) { return each.unpackedBytes; });
}

std::string SpaceCheck::description() const {
    std::string text =
        "the plan needs " + formatBytes(needed) + ", the device has " + formatBytes(free) + " free";
    if (reclaimed > 0) text += " and gets " + formatBytes(reclaimed) + " back from removals";
    if (!fits()) {
        text += ", " + formatBytes(missing()) +
                " are missing: free space on the device or take packages out of the library";
    }
    return text;
}

SyncPlan makePlan(const Library& library, const std::vector<ApplicationRecord>& present,
                  const PlanOptions& options) {
    return Planner(library, present, options).make();
}

std::set<std::string> identifiersInStep(const Library& library,
                                        const std::vector<ApplicationRecord>& present) {
    std::set<std::string> inStep;
    for (const ApplicationRecord& each : present) {
        const LibraryPackage* package = library.find(each.identifier);
        const bool isSame = !each.isPlaceholder && package != nullptr &&
                            package->version == each.version.value_or("");
        if (isSame) inStep.insert(each.identifier);
    }
    return inStep;
}

SyncPlan allowedBy(const DeviceSettings& settings, SyncPlan plan) {
    if (settings.removal == PolicyAnswer::No) {
        for (std::string& identifier : plan.remove) {
            plan.skipped.push_back({std::move(identifier), std::string(kRemovalForbidden), true});
        }
        plan.remove.clear();
        plan.reclaimed = 0;
    }
    if (settings.installation == PolicyAnswer::No) {
        for (auto* installs : {&plan.install, &plan.update}) {
            for (const PlannedInstall& each : *installs) {
                if (each.isLeftOver) continue;  // of a restore, which no policy keeps from coming
                plan.skipped.push_back(
                    {each.identifier, std::string(kInstallationForbidden), true});
            }
            std::erase_if(*installs, [](const PlannedInstall& each) { return !each.isLeftOver; });
        }
    }
    for (auto* installs : {&plan.install, &plan.update}) {
        for (const PlannedInstall& each : *installs) {
            if (isDoubtful(each)) plan.failed.push_back({each.identifier, each.doubt});
        }
        std::erase_if(*installs, isDoubtful);
    }
    return plan;
}

SyncPlan makeStagedPlan(const PropertyList& todoList, const std::vector<ApplicationRecord>& present,
                        const StagedPlanOptions& options) {
    return StagedPlanner(present, options).make(todoList);
}

ErrorRecord installationForbidden() {
    return failure(kInstallationForbidden, "allow it with appsync set DEVICE installation=yes");
}

}  // namespace appsync
