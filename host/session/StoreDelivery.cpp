#include "host/session/StoreDelivery.h"

#include <chrono>
#include <memory>
#include <optional>

#include "client/Paths.h"
#include "device/Device.h"
#include "device/values/DeviceRecords.h"
#include "device/values/PackageIdentifier.h"
#include "host/console/Problem.h"
#include "host/plan/Library.h"
#include "host/plan/StandingInstalls.h"
#include "host/watch/SessionFacts.h"
#include "platform/AppRegistry.h"
#include "platform/FileURL.h"
#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"

namespace appsync {
namespace {

// A number of the platform's, as every install gives it.
constexpr std::uint64_t kInstallTargetType = 1;

// How often a wait for the device looks whether it is to stop.
constexpr std::chrono::milliseconds kLookInterval{50};

Status handInPlaceholder(InstallCoordinatorService& service, InstallCoordinator& coordinator,
                         const ApplicationRecord& application) {
    if (coordinator.hasPlaceholderPromise()) return {};
    const auto placeholder =
        service.makeAppPlaceholder(application.name.value_or(application.identifier),
                                   application.identifier, kInstallTypeSync, SyncClientID);
    if (placeholder != nullptr) {
        if (Status complete = placeholder->setConfigurationComplete(); !complete) return complete;
    }
    return coordinator.setPlaceholderPromise(placeholder);
}

}  // namespace

bool isOffloadedSystemApplication(const ApplicationRecord& application) {
    return application.isPlaceholder && application.type == kApplicationTypeSystem &&
           (application.installType == kInstallTypeDowngrade ||
            application.installType == kInstallTypeIntentionalDowngrade);
}

Status awaitPackage(InstallCoordinatorService& service, const ApplicationRecord& application) {
    const auto found =
        service.coordinator(CoordinatorKind::Initiating, application.identifier, SyncClientID,
                            InstallCoordinatorService::Creation::CreateIfNotExisting);
    if (found.error) return *found.error;
    if (found.coordinator == nullptr) {
        return failure("the device coordinates no install of it", "see appsync why");
    }
    InstallCoordinator& coordinator = *found.coordinator;
    if (coordinator.creatorIdentifier() != SyncClientID) {
        return ErrorRecord::make(
            kCommandErrorDomain, kExitSomethingFailed,
            heldSentence(application.identifier, coordinator.creatorIdentifier()));
    }
    Status status;
    if (!coordinator.hasInstallOptions()) {
        status = coordinator.setInstallOptions({{}, kInstallTypeSync, kInstallTargetType});
    }
    if (status && !coordinator.hasInitialODRAssetPromises()) {
        status = coordinator.setInitialODRAssetPromises({});
    }
    if (status && !coordinator.appAssetPromiseResponsibleClient()) {
        status = coordinator.setAppAssetPromiseResponsibleClient(AppStoreClientID);
    }
    return status ? handInPlaceholder(service, coordinator, application) : status;
}

Result<std::uint64_t> deliverFromStore(InstallCoordinatorService& service,
                                       InstallCoordinator& coordinator,
                                       const LibraryPackage& package, PackageSender& sender,
                                       const PackageSender::Progress& progress) {
    const std::string& identifier = package.identifier;
    const std::string name = archiveNameOf(identifier);
    Result<std::uint64_t> sent =
        sender.send(package.file, std::string(kPublicStaging), name, progress);
    if (!sent) return sent;
    const auto path = FileURL::fromPath(std::string(kPublicStaging) + "/" + name, false);
    auto promise = coordinator.appAssetPromise();
    if (promise == nullptr) {
        promise = service.makePathTransferPromise(identifier + "-Asset", AppStoreClientID, path,
                                                  package.bytes);
        if (const Status set = coordinator.setAppAssetPromise(promise); !set) return set.error();
    } else {
        promise->setTransferPath(*path);
    }
    promise->setPercentComplete(1.0);
    promise->setComplete();
    return sent;
}

namespace {

Result<std::uint64_t> sendAsStore(Device& device, InstallCoordinatorService& service,
                                  const LibraryPackage& package,
                                  const std::function<bool()>& stopRequested) {
    const auto coordinator = service.existingCoordinator(package.identifier, SyncClientID);
    if (coordinator == nullptr) return failure("its install was cancelled", "send it again");
    PackageSender sender(device);
    return deliverFromStore(
        service, *coordinator, package, sender,
        [&stopRequested](std::uint64_t, std::uint64_t) { return !stopRequested(); });
}

}  // namespace

SessionEnd bringBack(Device& device, InstallCoordinatorService& service,
                     const ApplicationRecord& application, const LibraryPackage* package,
                     SessionFacts& facts, const std::function<bool()>& stopRequested) {
    const std::string& identifier = application.identifier;
    facts.reconciled();
    facts.requested(identifier);
    // One that is complete must not be installed before it has been looked at.
    const Status awaited = awaitPackage(service, application);
    device.letCoordinatedInstallsGo();
    if (!awaited) {
        facts.failed(identifier, awaited.error().description());
        return {};
    }
    if (package != nullptr) {
        const Result<std::uint64_t> sent = sendAsStore(device, service, *package, stopRequested);
        if (!sent) {
            facts.failed(identifier, sent.error().description());
            device.cancelCoordinator(identifier, SyncClientID).ignore();
            return {};
        }
        facts.sent(*sent);
    }
    while (!device.waitForCoordinatedInstalls(kLookInterval)) {
        if (stopRequested()) return {};
    }
    const Result<ApplicationStatus> status = device.status(identifier);
    if (status && status->lastFailure) {
        facts.failed(identifier, status->lastFailure->error.description());
    }
    return {};
}

}  // namespace appsync
