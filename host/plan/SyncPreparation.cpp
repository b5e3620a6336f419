#include "host/plan/SyncPreparation.h"

#include <algorithm>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "device/Device.h"
#include "host/console/Problem.h"
#include "host/plan/LibraryReader.h"
#include "host/plan/RestoredParts.h"

namespace appsync {
namespace {

class Preparing {
  public:
    Preparing(Device& device, const Library& library) : device_(device), library_(library) {}

    Result<SyncPreparation> ofLibrary(PlanOptions options) {
        if (Status looked = look(); !looked) return looked.error();
        options.bringsOffloaded = settings_.coordination;
        options.howRestoredComes = [this](const std::string& identifier) {
            return appsync::howRestoredComes(device_, identifier);
        };
        sync_.plan = makePlan(library_, present_, options);
        sync_.givenUp = stagedWorkOn(device_);
        return finish();
    }

    Result<SyncPreparation> ofStagingArea() {
        if (Status looked = look(); !looked) return looked.error();
        sync_.staged = readStagedTodoList(device_);
        StagedPlanOptions options;
        options.bringsOffloaded = settings_.coordination;
        options.howRestoredComes = [this](const std::string& identifier) {
            return appsync::howRestoredComes(device_, identifier);
        };
        options.packageOf = [this](const std::string& identifier) {
            return packageFor(library_, identifier, device_.propertyLists());
        };
        options.stagedVersionOf = [this](const std::string& identifier) {
            return stagedVersion(device_, sync_.staged, identifier);
        };
        sync_.plan = makeStagedPlan(sync_.staged.list, present_, options);
        sync_.plan.notes = library_.notes;
        if (sync_.staged.isAbsent()) {
            sync_.plan.notes.emplace_back(
                "no staging area waits on the device: appsync stage DEVICE LIBRARY leaves one");
        }
        if (sync_.staged.isTakenUp) {
            sync_.plan.notes.emplace_back("this takes up the session that was interrupted");
        }
        if (sync_.staged.error) sync_.plan.failed.push_back(unusableList());
        return finish();
    }

  private:
    Status look() {
        Result<std::vector<ApplicationRecord>> present = device_.applicationsOnDisk();
        if (!present) return unusable(present.error());
        present_ = *std::move(present);
        const Result<DeviceSettings> settings = device_.settings();
        if (!settings) return unusable(settings.error());
        settings_ = *settings;
        return settings_.coordination ? Status() : leaveOutWhatIsGivenUp();
    }

    // A session without coordination begins by giving up every coordinator, with its placeholder.
    Status leaveOutWhatIsGivenUp() {
        const Result<std::vector<CoordinatorRecord>> coordinators = device_.coordinators();
        if (!coordinators) return unusable(coordinators.error());
        std::set<std::string> givenUp;
        for (const CoordinatorRecord& each : *coordinators) {
            if (each.restores() && each.placeholderStands) givenUp.insert(each.identifier);
        }
        std::erase_if(present_, [&](const ApplicationRecord& each) {
            return each.isPlaceholder && givenUp.contains(each.identifier);
        });
        return {};
    }

    [[nodiscard]] SyncFailure unusableList() const {
        return {"ApplicationsSync.plist",
                "the todo list of the staging area cannot be used: " + *sync_.staged.error +
                    (sync_.staged.isTooLarge ? "; split it, nothing was done"
                                             : "; write the staging area anew")};
    }

    Result<SyncPreparation> finish() {
        Status status = takeUpStanding();
        if (status) status = checkSpace();
        if (!status) return status.error();
        return std::move(sync_);
    }

    Status takeUpStanding() {
        if (!settings_.coordination) return {};  // a session begins by dropping what stands
        const Result<std::vector<CoordinatorRecord>> coordinators = device_.coordinators();
        if (!coordinators) return unusable(coordinators.error());
        sync_.standing = takeUp(sync_.plan, *coordinators, present_, standingRules());
        return {};
    }

    [[nodiscard]] StandingRules standingRules() const {
        StandingRules rules;
        rules.isForbidden = settings_.installation == PolicyAnswer::No;
        rules.arrivedVersion = [this](const std::string& identifier) {
            return versionOfArrived(device_, identifier);
        };
        rules.libraryVersion = [this](const std::string& identifier) {
            const LibraryPackage* package = library_.find(identifier);
            return package != nullptr ? std::optional(package->version) : std::nullopt;
        };
        return rules;
    }

    [[nodiscard]] std::string missingPermission() const {
        const bool installs = !sync_.plan.install.empty() || !sync_.plan.update.empty();
        std::string text;
        if (installs && settings_.installation == PolicyAnswer::No) text = "installation=yes";
        if (!sync_.plan.remove.empty() && settings_.removal == PolicyAnswer::No) {
            text += text.empty() ? "removal=yes" : " removal=yes";
        }
        return text;
    }

    Status checkSpace() {
        const Result<std::uint64_t> free = device_.freeSpace();
        if (!free) return unusable(free.error());
        sync_.allowed = allowedBy(settings_, sync_.plan);
        sync_.forbidden = sync_.allowed.skipped.size() - sync_.plan.skipped.size();
        sync_.permission = missingPermission();
        sync_.space = {sync_.allowed.needed(), *free, sync_.allowed.reclaimed};
        return {};
    }

    Device& device_;
    const Library& library_;
    std::vector<ApplicationRecord> present_;
    DeviceSettings settings_;
    SyncPreparation sync_;
};

// What removals give back is there by the time that the first package comes.
void makeRoomFor(Device& device, const SpaceCheck& space) {
    device.makeRoom(space.needed - std::min(space.needed, space.reclaimed));
}

Status removeLeftovers(Device& device, const StandingInstalls& standing) {
    const Status cancelled = cancelObsolete(device, standing);
    if (!cancelled) return unusable(cancelled.error());
    const Result<std::vector<std::string>> placeholders = device.removeLeftoverSyncPlaceholders();
    if (!placeholders) return unusable(placeholders.error());
    return {};
}

Status stageInterrupted(Device& device, SyncPreparation& sync) {
    if (sync.staged.isTakenUp) {
        const Status again = stageAgain(device, sync.staged.list, sync.plan);
        if (!again) return again;
    }
    // Where it cannot be noted, as in an area that is a link, an interruption is final.
    if (sync.staged.list.isArray()) {
        beginStagedSession(device, std::exchange(sync.staged.list, {})).ignore();
    }
    return {};
}

ErrorRecord cannotPrepare(const ErrorRecord& error) {
    return unusable(error.withContext("cannot prepare the device for the sync"));
}

}  // namespace

Result<SyncPreparation> prepareSync(Device& device, const Library& library,
                                    const PlanOptions& options) {
    return Preparing(device, library).ofLibrary(options);
}

Result<SyncPreparation> prepareStagedSync(Device& device, const Library& library) {
    return Preparing(device, library).ofStagingArea();
}

Status clearTheWay(Device& device, const SyncPreparation& sync, const Library& library,
                   const StepProgress& progress) {
    makeRoomFor(device, sync.space);
    Status status = removeLeftovers(device, sync.standing);
    if (!status) return status;
    status = removeStaleTransfers(device, sync.standing.arrived);
    if (status) status = writeStagingArea(device, sync.plan, library, progress);
    return status ? status : cannotPrepare(status.error());
}

Status clearTheWayForStaged(Device& device, SyncPreparation& sync) {
    makeRoomFor(device, sync.space);
    Status status = removeLeftovers(device, sync.standing);
    if (!status) return status;
    status = removeStaleTransfers(device, sync.standing.arrived);
    if (status) status = stageInterrupted(device, sync);
    return status ? status : cannotPrepare(status.error());
}

}  // namespace appsync
