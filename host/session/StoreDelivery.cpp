#include "host/session/StoreDelivery.h"

#include <memory>
#include <optional>

#include "client/Paths.h"
#include "device/values/DeviceRecords.h"
#include "device/values/PackageIdentifier.h"
#include "host/plan/Library.h"
#include "platform/AppRegistry.h"
#include "platform/FileURL.h"
#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"

namespace appsync {
namespace {

// A number of the platform's, as every install gives it.
constexpr std::uint64_t kInstallTargetType = 1;

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
    InstallCoordinator& coordinator = *found.coordinator;
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

}  // namespace appsync
