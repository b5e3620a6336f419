#include "host/WhyAnswer.h"

#include "device/DeviceRecords.h"
#include "host/Text.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {
namespace {

AwaitedThing awaited(std::string what, std::string who, std::string sentence) {
    return {std::move(what), std::move(who), std::nullopt, std::move(sentence)};
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

std::optional<AwaitedThing> awaitedOfPlaceholder(const ApplicationRecord& placeholder,
                                                 bool sessionUnderWay) {
    switch (placeholder.installType) {
        case kInstallTypeSync:
            return awaitedOfSync(placeholder, sessionUnderWay);
        case kInstallTypeDowngrade:
        case kInstallTypeIntentionalDowngrade:
            return awaited("store", "store",
                           "for its package, as it is offloaded: appsync send brings it back");
        default:
            return awaited("install", "store", "for an install of its package");
    }
}

std::optional<AwaitedThing> awaitedThing(const std::string& identifier,
                                         const ApplicationStatus& status) {
    if (status.denial) {
        AwaitedThing thing =
            awaited("termination", identifier,
                    "for the running application to end: quit it (appsync quit); next try at " +
                        formatClock(status.denial->nextTry));
        thing.nextTry = status.denial->nextTry;
        return thing;
    }
    if (status.awaitsRestoreData) {
        return awaited("restore data", "host",
                       "for its data: send it (appsync send --restore --parts 2)");
    }
    if (!status.placeholder) return std::nullopt;
    return awaitedOfPlaceholder(*status.placeholder, status.sessionUnderWay);
}

std::string versionText(const ApplicationRecord& record) {
    return record.version ? " " + printable(*record.version) : "";
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
        text += "; a person removed it at " + formatTime(*status.uninstalled);
    }
    return text;
}

}  // namespace

WhyAnswer explain(const std::string& identifier, const ApplicationStatus& status) {
    WhyAnswer answer;
    answer.identifier = identifier;
    answer.state = status.installed ? "installed" : status.placeholder ? "placeholder" : "absent";
    answer.waitsFor = awaitedThing(identifier, status);
    if (status.lastFailure) answer.lastError = status.lastFailure->error.description();
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
