#include <string_view>
#include <utility>

#include "client/AppsClient.h"
#include "coordination/InstallErrors.h"
#include "coordination/InstallSteps.h"
#include "platform/InstallCoordinatorService.h"

namespace appsync {

namespace {

constexpr std::string_view kCreateCoordinator = "Create coordinator";
constexpr std::string_view kCoordinatorCreated = "Finished creating coordinator";
constexpr std::string_view kCreatePlaceholder = "Create placeholder";
constexpr std::string_view kPlaceholderCreated = "Finished creating placeholder";

// Endings of promises' names; they follow the bundle identifier.
constexpr std::string_view kAssetSuffix = "-Asset";
constexpr std::string_view kIconSuffix = "-Icon";
constexpr std::string_view kUserDataSuffix = "-UserData";

constexpr std::uint64_t kUnknownSize = 0;

std::string promiseName(const std::string& identifier, std::string_view suffix) {
    return identifier + std::string(suffix);
}

void keep(Promise& promise) {
    promise.setPercentComplete(1.0);
    promise.setComplete();
}

/// A promise with a file at the path, or without one when there is no path. Null also for a path
/// that no URL can hold.
std::shared_ptr<PathTransferPromise> makePathPromise(InstallCoordinatorService& service,
                                                     const std::string& name,
                                                     const std::optional<std::string>& path,
                                                     std::uint64_t size) {
    std::optional<FileURL> url;
    if (path) {
        url = FileURL::fromPath(*path, false);
        if (!url) return nullptr;
    }
    return service.makePathTransferPromise(name, SyncClientID, url, size);
}

}  // namespace

std::shared_ptr<InstallCoordinator>
AppsClient::_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
    const std::string& identifier, bool existingApp, bool createIfNotExisting, ErrorOut error) {
    using Creation = InstallCoordinatorService::Creation;
    logStepStart(platform_.transactions, InstallStep::CreateCoordinator, identifier,
                 kCreateCoordinator);
    const CoordinatorKind kind =
        existingApp ? CoordinatorKind::Updating : CoordinatorKind::Initiating;
    const std::string_view kindName = existingApp ? "updating" : "initiating";
    auto [coordinator, wasCreated, serviceError] = platform_.coordination.coordinator(
        kind, identifier, SyncClientID,
        createIfNotExisting ? Creation::CreateIfNotExisting : Creation::OnlyExisting);
    if (coordinator != nullptr && coordinator->creatorIdentifier() != SyncClientID) {
        log_(Level::Default,
             "%s|TS returned %s coordinator %{public}@ (createIfNotExisting:%d, existingApp:%d, "
             "creatorIdentifier=%lu) for %{public}@ with error %{public}@ - Will not perform "
             "install/update for this bundle",
             kindName, coordinator->description(), createIfNotExisting, existingApp,
             coordinator->creatorIdentifier(), identifier, serviceError);
        coordinator.reset();
    } else if (coordinator != nullptr) {
        log_(Level::Default,
             "%s|Created %s coordinator %{public}@ (createIfNotExisting:%d, existingApp:%d) for "
             "%{public}@ with error %{public}@",
             kindName, coordinator->description(), createIfNotExisting, existingApp, identifier,
             serviceError);
    }
    if (error != nullptr) *error = std::move(serviceError);
    logStepEnd(platform_.transactions, InstallStep::CreateCoordinator, coordinator != nullptr,
               identifier, kCoordinatorCreated);
    return coordinator;
}

std::shared_ptr<InstallPlaceholder> AppsClient::_placeHolderForBundleIdentifier(
    const std::string& identifier, const std::string& name, std::uint64_t installType) {
    logStepStart(platform_.transactions, InstallStep::CreatePlaceholder, identifier,
                 kCreatePlaceholder);
    auto placeholder =
        platform_.coordination.makeAppPlaceholder(name, identifier, installType, SyncClientID);
    logStepEnd(platform_.transactions, InstallStep::CreatePlaceholder, placeholder != nullptr,
               identifier, kPlaceholderCreated);
    const auto description =
        placeholder != nullptr ? std::optional(placeholder->description()) : std::nullopt;
    log_(Level::Default, "%s|Created placeholder %{public}@ for '%{public}@' of type %lu",
         description, identifier, installType);
    return placeholder;
}

std::shared_ptr<PathTransferPromise> AppsClient::_createAppAssetPromiseForBundleIdentifier(
    const std::string& identifier, const std::optional<std::string>& path,
    InstallCoordinator* coordinator, ErrorOut error) {
    if (coordinator == nullptr) return nullptr;
    auto promise = makePathPromise(platform_.coordination, promiseName(identifier, kAssetSuffix),
                                   path, kUnknownSize);
    if (promise == nullptr) {
        log_(Level::Error, "%s|Error creating asset promise for '%{public}@'", identifier);
        return nullptr;
    }
    const Status added = coordinator->setAppAssetPromise(promise);
    if (added) {
        log_(Level::Default, "%s|Added app asset promise to coordinator for '%{public}@'",
             identifier);
        return promise;
    }
    report(added, error);
    log_(Level::Error, "%s|Error %{public}@ adding app asset promise at %{public}@ to '%{public}@'",
         added.error(), path, identifier);
    log_(Level::Error, "%s|Cancelling asset promise for '%{public}@'", identifier);
    promise->cancelForReason(makeInstallError(InstallError::InstallFailed), SyncClientID);
    return nullptr;
}

std::shared_ptr<PathTransferPromise> AppsClient::_createIconPromiseForBundleIdentifier(
    const std::string& identifier, const std::string& path, std::uint64_t diskSpaceNeeded,
    InstallPlaceholder* placeholder, bool forAppInstall, ErrorOut error) {
    if (placeholder == nullptr) {
        log_(Level::Error, "%s|Placeholder to add icon promise is nil for '%{public}@'",
             identifier);
        return nullptr;
    }
    auto promise = makePathPromise(platform_.coordination, promiseName(identifier, kIconSuffix),
                                   path, diskSpaceNeeded);
    if (promise == nullptr) return nullptr;
    keep(*promise);
    const Status added = placeholder->setIconPromise(promise);
    if (added) {
        log_(Level::Default, "%s|Added icon promise to placeholder for '%{public}@'", identifier);
        return promise;
    }
    report(added, error);
    log_(Level::Error, "%s|Error %{public}@ adding icon promise to placeholder for '%{public}@'",
         added.error(), identifier);
    promise->cancelForReason(
        makeInstallError(forAppInstall ? InstallError::InstallFailed : InstallError::RestoreFailed),
        SyncClientID);
    return nullptr;
}

std::shared_ptr<OutOfBandPromise> AppsClient::_userDataPromiseForBundleIdentifier(
    const std::string& identifier) {
    auto promise = platform_.coordination.makeOutOfBandPromise(
        promiseName(identifier, kUserDataSuffix), SyncClientID, kUnknownSize);
    if (promise != nullptr) keep(*promise);
    return promise;
}

}  // namespace appsync
