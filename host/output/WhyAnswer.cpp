#include "host/output/WhyAnswer.h"

#include "device/values/DeviceRecords.h"
#include "host/console/Text.h"
#include "platform/AppRegistry.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {
namespace {

AwaitedThing awaited(std::string what, std::string who, std::string sentence) {
    return {std::move(what), std::move(who), std::nullopt, std::nullopt, std::move(sentence)};
}

AwaitedThing awaitedOfPolicy() {
    return awaited("policy", "device",
                   "for device policy, which does not allow installing applications: allow it "
                   "(appsync set DEVICE installation=yes)");
}

bool isOfRestore(const CoordinatorRecord& coordinator) {
    return coordinator.kind.starts_with("restoring");
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
                   "for the next session, in which the device installs it, as everything is "
                   "there: run appsync sync");
}

AwaitedThing awaitedOfClient(const CoordinatorRecord& coordinator, bool sessionUnderWay) {
    const std::string what = coordinator.waitsFor;
    const auto client = coordinator.waitsForClient;
    if (!client) return awaited("promise", "client", "as " + what);
    if (*client == AppStoreClientID) {
        return awaited("store", "store", "for the store: " + what + " (appsync store)");
    }
    if (*client != SyncClientID) {
        return awaited("promise", "client " + std::to_string(*client),
                       "as " + what + ": wait, or cancel it (appsync coordinator)");
    }
    if (sessionUnderWay) return awaited("transfer", "host", "for the host: " + what);
    return awaited("sync", "host", "for the next sync: " + what + ": run appsync sync again");
}

AwaitedThing awaitedOfCoordinator(const CoordinatorRecord& coordinator, bool sessionUnderWay) {
    if (coordinator.isComplete) return awaitedOfComplete(sessionUnderWay);
    AwaitedThing thing = awaitedOfClient(coordinator, sessionUnderWay);
    thing.promise = missingPromise(coordinator);
    return thing;
}

AwaitedThing awaitedOfSync(const ApplicationRecord& placeholder, bool sessionUnderWay) {
    if (!sessionUnderWay) {
        return awaited("sync", "host", "for the next sync: run appsync sync again");
    }
    const bool isLoading =
        !placeholder.progress || placeholder.progress->phase == kInstallPhaseLoading;
    return isLoading ? awaited("transfer", "host", "for its package, which the host is sending")
                     : awaited("install", "device", "for its install, which is under way");
}

AwaitedThing awaitedOfOffloaded(const ApplicationRecord& placeholder, bool isCoordinated) {
    if (isCoordinated && placeholder.type == kApplicationTypeSystem) {
        return awaited("store", "store",
                       "for the store, as it is an offloaded application of the system (appsync "
                       "store), or send it (appsync send)");
    }
    if (isCoordinated) {
        return awaited("sync", "host",
                       "for its package, as it is offloaded: run appsync sync with a library that "
                       "holds it");
    }
    return awaited("transfer", "host",
                   "for its package, as it is offloaded: send it (appsync send)");
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
            return awaited("transfer", "host",
                           "for its package, as a restore brought it back: send it (appsync send "
                           "--restore)");
        default:
            return awaited("install", "store", "for an install of its package");
    }
}

// Whether what it waits for is something that policy keeps from happening.
bool isForbidden(const ApplicationStatus& status, const DeviceSettings& settings) {
    if (settings.installation != PolicyAnswer::No) return false;
    if (status.coordinator) {
        return !isOfRestore(*status.coordinator) && !status.coordinator->isComplete;
    }
    return status.placeholder || !status.installed;
}

std::optional<AwaitedThing> awaitedThing(const std::string& identifier,
                                         const ApplicationStatus& status,
                                         const DeviceSettings& settings) {
    if (status.denial) {
        AwaitedThing thing =
            awaited("termination", identifier,
                    "for the running application to end: quit it (appsync quit); next try at " +
                        formatClock(status.denial->nextTry));
        thing.nextTry = status.denial->nextTry;
        return thing;
    }
    if (status.awaitsRestoreData) {
        return awaited(
            "restore data", "host",
            "for its data: send it after its package (appsync send --restore --parts 1, then "
            "--parts 2), or send the package with --parts 3 to use what the restore has left");
    }
    if (isForbidden(status, settings)) return awaitedOfPolicy();
    if (status.coordinator) {
        return awaitedOfCoordinator(*status.coordinator, status.sessionUnderWay);
    }
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
                  const DeviceSettings& settings) {
    WhyAnswer answer;
    answer.identifier = identifier;
    answer.state = status.installed ? "installed" : status.placeholder ? "placeholder" : "absent";
    answer.waitsFor = awaitedThing(identifier, status, settings);
    if (status.lastFailure) {
        answer.lastError = status.lastFailure->error.description();
    } else if (status.coordinator && status.coordinator->error) {
        answer.lastError = status.coordinator->error->description();
    }
    answer.sentence = stateSentence(status);
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
