#include "simulation/recording/KnownCalls.h"

#include <algorithm>
#include <cctype>
#include <map>
#include <set>
#include <string>

namespace appsync {
namespace {

using Methods = std::set<std::string, std::less<>>;

/// The methods of each service.
using Calls = std::map<std::string, Methods, std::less<>>;

const Calls& coordinationCalls() {
    static const Calls calls{
        {"InstallCoordinator",
         {"bundleIdentifier", "creatorIdentifier", "error", "setObserver", "hasInstallOptions",
          "setInstallOptions", "hasInitialODRAssetPromises", "setInitialODRAssetPromises",
          "appAssetPromise", "setAppAssetPromise", "appAssetPromiseResponsibleClient",
          "setAppAssetPromiseResponsibleClient", "hasUserDataPromise", "setUserDataPromise",
          "hasPlaceholderPromise", "setPlaceholderPromise", "cancelForReason"}},
        {"InstallCoordinatorObserver",
         {"promiseDidBeginFulfillmentWithIdentifier", "coordinatorDidInstallPlaceholder",
          "coordinatorDidCompleteSuccessfully", "coordinatorCanceledWithReason",
          "coordinatorShouldPrioritize"}},
        {"InstallCoordinatorService",
         {"isCoordinationEnabled", "coordinator", "existingCoordinator", "makePathTransferPromise",
          "makeOutOfBandPromise", "makeAppPlaceholder", "uninstallApp", "userPresentableError",
          "makeAppInstallObserver"}},
        {"InstallPlaceholder",
         {"setIconPromise", "setAttributes", "setMetadata", "setSinf", "setConfigurationComplete",
          "cancelForReason"}},
        {"OutOfBandPromise",
         {"name", "clientIdentifier", "percentComplete", "setPercentComplete", "isComplete",
          "setComplete", "cancelForReason"}},
        {"PathTransferPromise",
         {"name", "clientIdentifier", "percentComplete", "setPercentComplete", "isComplete",
          "setComplete", "cancelForReason", "transferPath", "setTransferPath"}},
        {"TransferService",
         {"canCancelTransfers", "cancelTransferForFailedAsset", "canPrioritizeAssets",
          "prioritizeAsset"}},
    };
    return calls;
}

const Calls& otherCalls() {
    static const Calls calls{
        {"AppRegistry",
         {"proxyForIdentifier", "isApplicationInstalled", "enumerateBundles", "installProgress",
          "finishInstallPhase", "installPackage", "installPlaceholderBundle",
          "uninstallApplication", "addObserver", "removeObserver"}},
        {"AppRegistryObserver",
         {"applicationInstallsArePrioritized", "applicationInstallsDidCancel"}},
        {"BackupManager", {"restoreDataExists", "cancelApplicationRestore"}},
        {"BackupService", {"makeManager"}},
        {"DevicePolicyService", {"effectiveValue"}},
        {"FileSystem",
         {"itemExists", "attributes", "createDirectory", "removeItem", "moveItem", "copyItem",
          "readFile", "writeFileAtomically", "createFile", "setTimesToNow", "temporaryDirectory"}},
        {"HomeScreenConnection", {"setIconState", "flattenedIconState"}},
        {"HomeScreenService", {"blockableConnection", "takeTerminationAssertion"}},
        {"IconRenderer", {"openBundle", "homeScreenIcon", "createImageDestination"}},
        {"ImageDestination", {"addImage", "finalize"}},
        {"InstallProgressRecord",
         {"installState", "setInstallState", "installPhase", "setInstallPhase", "totalUnitCount",
          "setTotalUnitCount", "completedUnitCount", "setCompletedUnitCount", "cancel",
          "description"}},
        {"InstallTransactionLog", {"initialize", "logStep", "logScenario"}},
        {"InstallerService", {"lookupUninstalled", "clearUninstalled"}},
        {"Lock", {"lock", "unlock"}},
        {"LogFacility", {"makeHandle"}},
        {"NamedNotifications", {"registerForState", "setState", "post"}},
        {"NotificationCenter", {"addObserver", "removeObserver"}},
        {"NotificationCenterObserver", {"callback"}},
        {"OperationQueue", {"add", "setMaximumConcurrentOperations"}},
        {"PropertyListSerialization", {"parse", "serialize", "replaceText"}},
        {"Semaphore", {"signal", "wait"}},
        {"SerialQueue", {"sync"}},
        {"SyncHost", {"mainBundleIdentifier", "isRecoverableError", "transferService"}},
        {"TerminationAssertion", {"release"}},
        {"WaitGroup", {"enter", "leave", "wait", "waitFor"}},
        {"WorkQueues",
         {"makeSerialQueue", "makeOperationQueue", "makeWaitGroup", "makeSemaphore", "makeLock",
          "runAfter"}},
    };
    return calls;
}

/// Null when there is no such service.
const Methods* methodsOf(std::string_view service) {
    for (const Calls* calls : {&coordinationCalls(), &otherCalls()}) {
        const auto found = calls->find(withoutNumber(service));
        if (found != calls->end()) return &found->second;
    }
    return nullptr;
}

}  // namespace

bool isKnownCall(std::string_view name) {
    const std::size_t dot = name.find('.');
    if (dot == std::string_view::npos) return false;
    const Methods* methods = methodsOf(name.substr(0, dot));
    return methods != nullptr && methods->find(name.substr(dot + 1)) != methods->end();
}

std::string_view withoutNumber(std::string_view service) {
    const std::size_t sign = service.find('#');
    if (sign == std::string_view::npos) return service;
    const std::string_view number = service.substr(sign + 1);
    const bool isNumber = !number.empty() && std::all_of(number.begin(), number.end(), [](char c) {
        return std::isdigit(static_cast<unsigned char>(c)) != 0;
    });
    return isNumber ? service.substr(0, sign) : service;
}

bool isKnownService(std::string_view name) { return methodsOf(name) != nullptr; }

}  // namespace appsync
