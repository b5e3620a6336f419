#include "host/output/WhyAnswer.h"

#include "device/Device.h"
#include "device/values/DeviceRecords.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/output/FailureText.h"
#include "host/plan/RestoredParts.h"
#include "platform/AppRegistry.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {
namespace {

AwaitedThing awaited(std::string what, std::string who, std::string sentence) {
    return {std::move(what), std::move(who), std::nullopt, std::nullopt, std::move(sentence)};
}

// Each sentence gives what a person can do as commands that are carried out as they stand, once
// DEVICE, FILE and the like are put in: ", then" parts steps, ", or" parts ways.

AwaitedThing awaitedOfPolicy() {
    return awaited("policy", "device",
                   "for device policy, which does not allow installing applications: allow it "
                   "(appsync set DEVICE installation=yes)");
}

AwaitedThing awaitedOfNextSync(const std::string& reason) {
    return awaited("sync", "host",
                   "for the next sync" + reason +
                       ": run it with a library that holds the application (appsync sync DEVICE "
                       "LIBRARY)");
}

std::string storeCommand() { return "appsync store DEVICE FOLDER"; }

std::string sendCommand(const std::string& identifier, const std::string& options = "") {
    return "appsync send DEVICE " + identifier + " FILE" + options;
}

std::optional<std::string> missingPromise(const CoordinatorRecord& coordinator) {
    for (const PromiseRecord& promise : coordinator.promises) {
        if (!promise.complete && !promise.cancelled) return promise.name;
    }
    return std::nullopt;
}

AwaitedThing awaitedOfComplete(bool sessionUnderWay) {
    if (sessionUnderWay) return awaited("install", "device", "for its install, which is under way");
    return awaited("sync", "host",
                   "for the next sync, as everything is there: run it with a library that holds "
                   "the same version (appsync sync DEVICE LIBRARY)");
}

AwaitedThing awaitedOfClient(const CoordinatorRecord& coordinator, bool sessionUnderWay) {
    const std::string what = coordinator.waitsFor;
    const CoordinationClient client = coordinator.waitsForClient.value_or(coordinator.client);
    // The store keeps its promises in the installs that the host has begun.
    if (client == AppStoreClientID && coordinator.client == SyncClientID) {
        return awaited("store", "store", "for the store: " + what + " (" + storeCommand() + ")");
    }
    if (client != SyncClientID) {
        const std::string number = std::to_string(client);
        return awaited("promise", "client " + number,
                       "as " + what + ": wait, or cancel it (appsync coordinator DEVICE cancel " +
                           coordinator.identifier + " --client " + number + ")");
    }
    if (sessionUnderWay) return awaited("transfer", "host", "for the host: " + what);
    return awaitedOfNextSync(", as " + what);
}

AwaitedThing awaitedOfCoordinator(const CoordinatorRecord& coordinator, bool sessionUnderWay) {
    if (coordinator.isComplete) return awaitedOfComplete(sessionUnderWay);
    AwaitedThing thing = awaitedOfClient(coordinator, sessionUnderWay);
    thing.promise = missingPromise(coordinator);
    return thing;
}

AwaitedThing awaitedOfSync(const ApplicationRecord& placeholder, bool sessionUnderWay) {
    if (!sessionUnderWay) return awaitedOfNextSync("");
    const bool isLoading =
        !placeholder.progress || placeholder.progress->phase == kInstallPhaseLoading;
    return isLoading ? awaited("transfer", "host", "for its package, which the host is sending")
                     : awaited("install", "device", "for its install, which is under way");
}

bool isOffloadedPlaceholder(const ApplicationRecord& placeholder) {
    return placeholder.installType == kInstallTypeDowngrade ||
           placeholder.installType == kInstallTypeIntentionalDowngrade;
}

AwaitedThing awaitedOfOffloaded(const ApplicationRecord& placeholder, bool isCoordinated) {
    if (isCoordinated && placeholder.type == kApplicationTypeSystem) {
        return awaited("store", "store",
                       "for the store, as it is an offloaded application of the system (" +
                           storeCommand() + "), or send it (" +
                           sendCommand(placeholder.identifier) + ")");
    }
    if (isCoordinated) return awaitedOfNextSync(", as it is offloaded");
    return awaited("transfer", "host",
                   "for its package, as it is offloaded: send it (" +
                       sendCommand(placeholder.identifier) + ")");
}

AwaitedThing awaitedOfRestored(const ApplicationRecord& placeholder, bool isCoordinated) {
    if (isCoordinated) {
        return awaited("store", "store",
                       "for the store, as a restore brought it back (" + storeCommand() + ")");
    }
    return awaited("transfer", "host",
                   "for its package, as a restore brought it back: send it (" +
                       sendCommand(placeholder.identifier, " --restore") + ")");
}

AwaitedThing awaitedOfData(const std::string& identifier, bool packageWaits) {
    const char* what = packageWaits ? "for its data, as its package is there: " : "for its data: ";
    return awaited("restore data", "host", what + howRestoredDataComes(identifier, packageWaits));
}

std::optional<AwaitedThing> awaitedOfPlaceholder(const ApplicationRecord& placeholder,
                                                 bool sessionUnderWay, bool isCoordinated) {
    switch (placeholder.installType) {
        case kInstallTypeSync:
            return awaitedOfSync(placeholder, sessionUnderWay);
        case kInstallTypeDowngrade:
        case kInstallTypeIntentionalDowngrade:
            return awaitedOfOffloaded(placeholder, isCoordinated);
        case kInstallTypeRestore:
            return awaitedOfRestored(placeholder, isCoordinated);
        default:
            return awaited("install", "store", "for an install of its package");
    }
}

// Installs are not coordinated any more, and the next session finds that out.
AwaitedThing awaitedOfGivenUp() {
    return awaited("sync", "host",
                   "for nothing that will come, as the installs of this device are no longer "
                   "coordinated: turn that on again (appsync set DEVICE coordination=on), or run a "
                   "sync that brings it anew (appsync sync DEVICE LIBRARY)");
}

// What stands there when the coordinator has gone.
bool standsAlone(const ApplicationStatus& status) {
    return status.placeholder && isOffloadedPlaceholder(*status.placeholder) &&
           !status.coordinator->restores();
}

// No sync goes on with what brings an offloaded application of the system back.
bool isLeftToStore(const ApplicationStatus& status) {
    return standsAlone(status) && status.placeholder->type == kApplicationTypeSystem &&
           status.coordinator->client == SyncClientID;
}

AwaitedThing awaitedOfCoordination(const ApplicationStatus& status, bool isCoordinated) {
    if (!status.sessionUnderWay) {
        if (isCoordinated ? isLeftToStore(status) : standsAlone(status)) {
            return awaitedOfOffloaded(*status.placeholder, isCoordinated);
        }
        if (!isCoordinated) return awaitedOfGivenUp();
    }
    return awaitedOfCoordinator(*status.coordinator, status.sessionUnderWay);
}

// Whether what it waits for is something that policy keeps from happening: the package of what a
// restore has brought back comes from the store all the same, and so does what is being installed.
bool isForbidden(const ApplicationStatus& status, const DeviceSettings& settings) {
    if (settings.installation != PolicyAnswer::No) return false;
    if (!status.coordinator) {
        return status.awaitsRestoreData || status.placeholder || !status.installed;
    }
    const CoordinatorRecord& coordinator = *status.coordinator;
    if (coordinator.kind == "restoring" && coordinator.placeholderStands) return false;
    return !coordinator.isComplete || !status.sessionUnderWay;
}

std::optional<AwaitedThing> awaitedThing(const std::string& identifier,
                                         const ApplicationStatus& status,
                                         const DeviceSettings& settings, bool packageWaits) {
    if (status.denial) {
        AwaitedThing thing =
            awaited("termination", identifier,
                    "for the running application to end: quit it (appsync quit DEVICE " +
                        identifier + "); next try at " + formatClock(status.denial->nextTry));
        thing.nextTry = status.denial->nextTry;
        return thing;
    }
    if (isForbidden(status, settings)) return awaitedOfPolicy();
    if (status.awaitsRestoreData && !settings.coordination)
        return awaitedOfData(identifier, packageWaits);
    if (status.coordinator) return awaitedOfCoordination(status, settings.coordination);
    if (!status.placeholder) return std::nullopt;
    return awaitedOfPlaceholder(*status.placeholder, status.sessionUnderWay, settings.coordination);
}

std::string versionText(const ApplicationRecord& record) {
    return record.version ? " " + printable(*record.version) : " without a version";
}

std::string stateSentence(const ApplicationStatus& status) {
    std::string text;
    if (status.installed) {
        text = "is installed" + versionText(*status.installed);
    } else {
        text = status.placeholder ? "has a placeholder only" : "is not on the device";
    }
    if (status.isRunning) text += " and is running";
    if (status.uninstalled) {
        text += "; a person removed it at " + formatLocalTime(*status.uninstalled);
    }
    return text;
}

}  // namespace

WhyAnswer explain(const std::string& identifier, const ApplicationStatus& status,
                  const DeviceSettings& settings, bool packageWaits) {
    WhyAnswer answer;
    answer.identifier = identifier;
    answer.state = status.installed ? "installed" : status.placeholder ? "placeholder" : "absent";
    answer.waitsFor = awaitedThing(identifier, status, settings, packageWaits);
    if (status.lastFailure) {
        answer.lastError = failureText(identifier, status.lastFailure->error);
    } else if (status.coordinator && status.coordinator->error) {
        answer.lastError = failureText(identifier, *status.coordinator->error);
    }
    answer.sentence = stateSentence(status);
    return answer;
}

Result<WhyAnswer> whyOf(Device& device, const std::string& identifier) {
    const Result<ApplicationStatus> status = device.status(identifier);
    if (!status) return unusable(status.error());
    const Result<DeviceSettings> settings = device.settings();
    if (!settings) return unusable(settings.error());
    WhyAnswer answer = explain(identifier, *status, *settings,
                               versionThatWaitsForData(device, identifier).has_value());
    const bool isUnknown =
        answer.state == "absent" && !answer.lastError && !answer.waitsFor && !status->uninstalled;
    if (isUnknown) {
        return failure("the device knows nothing of " + identifier,
                       "appsync apps shows what there is");
    }
    return answer;
}

std::string whyText(const WhyAnswer& answer) {
    std::string text = printable(answer.identifier) + " " + answer.sentence + ".\n";
    text += answer.waitsFor ? "It waits " + answer.waitsFor->sentence + ".\n"
                            : "It waits for nothing.\n";
    if (answer.lastError) text += "Its last error: " + printable(*answer.lastError) + "\n";
    return text;
}

}  // namespace appsync
