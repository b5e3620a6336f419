#include <cstdint>
#include <utility>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "coordination/InstallErrors.h"
#include "coordination/InstallSteps.h"
#include "coordination/PlaceholderAttributesMap.h"
#include "platform/InstallCoordinatorService.h"
#include "restore/PlaceholderBundle.h"
#include "restore/RestoredApp.h"
#include "restore/RestoredMetadata.h"

namespace appsync {

/// One run of `prepareAppForRestoreUsingCoordination`.
struct AppsClient::CoordinatedRestore {
    const RestoredApp app;
    /// The store metadata, once it has been parsed.
    PropertyList metadata{};

    // What has been made so far.
    std::shared_ptr<InstallCoordinator> coordinator{};
    /// One that the coordinator did not take.
    std::shared_ptr<InstallPlaceholder> refusedPlaceholder{};
    /// The last failure of any step.
    std::optional<ErrorRecord> lastError{};

    [[nodiscard]] const std::string& identifier() const { return app.identifier; }
    /// Whether the step succeeded; if not, keeps its error.
    bool note(const Status& status) {
        if (!status) lastError = status.error();
        return status.ok();
    }
};

namespace {

constexpr std::string_view kRestoreApp = "Restore app";
constexpr std::string_view kRestoreDemotedApp = "Restore demoted app";

std::uint64_t installTypeFor(std::uint64_t demotionStatus) {
    switch (demotionStatus) {
        case kIntentionallyDemoted:
            return kInstallTypeIntentionalDowngrade;
        case kAutomaticallyDemoted:
            return kInstallTypeDowngrade;
        default:
            return kInstallTypeRestore;
    }
}

PlaceholderAttributes attributesFrom(const PropertyList& metadata) {
    PlaceholderAttributes attributes;  // not from an info dictionary: there is none yet
    attributes.launchProhibited = isLaunchProhibited(metadata);
    if (const std::string* version = bundleVersionOf(metadata)) attributes.bundleVersion = *version;
    return attributes;
}

// The pieces of a placeholder. Each is logged, and whether the placeholder took it is the answer.

bool setAttributes(const Log& log, InstallPlaceholder& placeholder, const std::string& identifier,
                   const PropertyList& metadata) {
    const PlaceholderAttributes attributes = attributesFrom(metadata);
    const Status set = placeholder.setAttributes(attributes);
    if (set) {
        log(Level::Default, "%s|set %{public}@ placeholder attributes for %{public}@",
            mapOf(attributes), identifier);
    } else {
        log(Level::Error, "%s|Error %{public}@ setting placeholder attributes for '%{public}@'",
            set.error(), identifier);
    }
    return set.ok();
}

bool setStoreMetadata(const Log& log, InstallPlaceholder& placeholder,
                      const std::string& identifier, const PropertyList& metadata) {
    const Status set = placeholder.setMetadata(StoreMetadata{metadata});
    if (set) {
        log(Level::Default, "%s|set store metadata on placeholder for %{public}@", identifier);
    } else {
        log(Level::Error, "%s|Error %{public}@ setting store metadata for '%{public}@'",
            set.error(), identifier);
    }
    return set.ok();
}

bool setSinf(const Log& log, InstallPlaceholder& placeholder, const std::string& identifier,
             const Bytes* sinf) {
    if (sinf == nullptr) return true;
    const Status set = placeholder.setSinf(*sinf);
    if (set) {
        log(Level::Default, "%s|set SINF data on placeholder for %{public}@", identifier);
    } else {
        log(Level::Error, "%s|Error %{public}@ setting SINF data for '%{public}@'", set.error(),
            identifier);
    }
    return set.ok();
}

bool setComplete(const Log& log, InstallPlaceholder& placeholder, const std::string& identifier) {
    const Status set = placeholder.setConfigurationComplete();
    if (set) {
        log(Level::Default, "%s|set placeholder configuration complete for %{public}@", identifier);
    } else {
        log(Level::Error,
            "%s|Error %{public}@ setting placeholder configuration as complete for '%{public}@'",
            set.error(), identifier);
    }
    return set.ok();
}

}  // namespace

bool AppsClient::prepareAppForRestoreUsingCoordination(const std::string& identifier,
                                                       const Bytes& vessikMetadata,
                                                       const Bytes* sinfData, const Bytes* iconData,
                                                       std::uint64_t demotionStatus) {
    if (demotionStatus != kNotDemoted) {
        return _prepareDemotedAppForRestoreWithBundleId(identifier, vessikMetadata, sinfData,
                                                        iconData, demotionStatus);
    }
    return _prepareNonDemotedAppForRestoreWithBundleId(identifier, vessikMetadata, sinfData,
                                                       iconData);
}

bool AppsClient::_prepareDemotedAppForRestoreWithBundleId(const std::string& identifier,
                                                          const Bytes& vessikMetadata,
                                                          const Bytes* sinfData,
                                                          const Bytes* iconData,
                                                          std::uint64_t demotionStatus) {
    log_(Level::Default,
         "%s|processing app restore for demoted bundle '%{public}@' with install coordination",
         identifier);
    logStepStart(platform_.transactions, InstallStep::Restore, identifier, kRestoreDemotedApp);
    CoordinatedRestore restore{
        .app = {identifier, vessikMetadata, sinfData, iconData, demotionStatus}};
    const bool status =
        beginRestore(restore, CoordinatorKind::RestoringDemoted) && addRestorePromises(restore);
    log_(Level::Default,
         "%s|processing app restore for demoted app %{public}@ finished with status %d error "
         "%{public}@",
         identifier, status, restore.lastError);
    logStepEnd(platform_.transactions, InstallStep::Restore, status, identifier,
               kRestoreDemotedApp);
    if (!status) giveRestoreUp(restore);
    return status;
}

bool AppsClient::_prepareNonDemotedAppForRestoreWithBundleId(const std::string& identifier,
                                                             const Bytes& vessikMetadata,
                                                             const Bytes* sinfData,
                                                             const Bytes* iconData) {
    log_(Level::Default,
         "%s|processing app restore for non demoted bundle '%{public}@' with install coordination",
         identifier);
    logStepStart(platform_.transactions, InstallStep::Restore, identifier, kRestoreApp);
    CoordinatedRestore restore{
        .app = {identifier, vessikMetadata, sinfData, iconData, kNotDemoted}};
    const bool hasBegun = beginRestore(restore, CoordinatorKind::Restoring);
    if (hasBegun && isLeftToAppStore(restore)) {
        logStepEnd(platform_.transactions, InstallStep::Restore, true, identifier, kRestoreApp);
        return true;
    }
    const bool status = hasBegun && addRestorePromises(restore) && leaveToAppStore(restore);
    log_(Level::Default,
         "%s|processing app restore for %{public}@ finished with status %d error %{public}@",
         identifier, status, restore.lastError);
    logStepEnd(platform_.transactions, InstallStep::Restore, status, identifier, kRestoreApp);
    if (!status) giveRestoreUp(restore);
    return status;
}

/// Gets what the restore goes by: the metadata and a coordinator.
bool AppsClient::beginRestore(CoordinatedRestore& restore, CoordinatorKind kind) {
    const std::string& identifier = restore.identifier();
    Result<PropertyList> metadata =
        parseVessikMetadata(identifier, restore.app.metadata, Level::Error);
    if (!metadata) {
        restore.lastError = metadata.error();
        return false;
    }
    restore.metadata = *std::move(metadata);
    auto found = platform_.coordination.coordinator(
        kind, identifier, SyncClientID, InstallCoordinatorService::Creation::CreateIfNotExisting);
    restore.coordinator = std::move(found.coordinator);
    restore.lastError = std::move(found.error);
    if (restore.coordinator != nullptr) return true;
    log_(Level::Error, "%s|Error %{public}@ creating restore coordinator for %{public}@",
         restore.lastError, identifier);
    return false;
}

bool AppsClient::isLeftToAppStore(const CoordinatedRestore& restore) const {
    const auto responsible = restore.coordinator->appAssetPromiseResponsibleClient();
    if (responsible != AppStoreClientID) return false;
    log_(Level::Default,
         "%s|App asset DRI for %{public}@ is set to %lu - nothing more for trd to do",
         restore.identifier(), *responsible);
    return true;
}

bool AppsClient::addRestorePromises(CoordinatedRestore& restore) {
    restore.coordinator->setObserver(weak_from_this());
    return addUserDataPromise(restore) && addRestorePlaceholder(restore);
}

bool AppsClient::addUserDataPromise(CoordinatedRestore& restore) {
    const std::string& identifier = restore.identifier();
    if (restore.coordinator->hasUserDataPromise()) {
        log_(Level::Default, "%s|Coordinator for %{public}@ has a valid user data promise",
             identifier);
        return true;
    }
    const auto promise = _userDataPromiseForBundleIdentifier(identifier);
    if (promise == nullptr) return true;  // the restore goes on without it
    const Status added = restore.coordinator->setUserDataPromise(promise);
    if (restore.note(added)) {
        log_(Level::Default, "%s|Added out of band user data promise for for %{public}@",
             identifier);
    } else {
        log_(Level::Error, "%s|Error %{public}@ adding out of band data promise for '%{public}@'",
             added.error(), identifier);
    }
    return added.ok();
}

bool AppsClient::addRestorePlaceholder(CoordinatedRestore& restore) {
    const RestoredApp& app = restore.app;
    if (restore.coordinator->hasPlaceholderPromise()) {
        log_(Level::Default, "%s|Coordinator for %{public}@ has a valid placeholder promise",
             app.identifier);
        return true;
    }
    auto placeholder = _placeHolderForBundleIdentifierWithVessikMetadata(
        app.identifier, restore.metadata, app.sinf, app.icon, app.demotionStatus);
    if (placeholder == nullptr) return false;
    const Status set = restore.coordinator->setPlaceholderPromise(placeholder);
    if (!restore.note(set)) {
        log_(Level::Error, "%s|Error %{public}@ setting placeholder promise for '%{public}@'",
             set.error(), app.identifier);
        restore.refusedPlaceholder = std::move(placeholder);
        return false;
    }
    relocantSetPlaceHolderPromiseForRestoreAppBundle(app.identifier);
    log_(Level::Default, "%s|added placeholder promise for %{public}@", app.identifier);
    return true;
}

bool AppsClient::leaveToAppStore(CoordinatedRestore& restore) {
    const Status set = restore.coordinator->setAppAssetPromiseResponsibleClient(AppStoreClientID);
    if (restore.note(set)) {
        log_(Level::Default, "%s|set CQClientAppStore to satisfy app asset promise for %{public}@",
             restore.identifier());
    } else {
        log_(Level::Error,
             "%s|Error %{public}@ setting CQClientAppStore to satisfy app data promise for "
             "'%{public}@'",
             set.error(), restore.identifier());
    }
    return set.ok();
}

/// Cancels the coordinator, then a placeholder that it did not take (an install does the reverse),
/// and stops awaiting it.
void AppsClient::giveRestoreUp(const CoordinatedRestore& restore) {
    const std::string& identifier = restore.identifier();
    const ErrorRecord reason = makeInstallError(InstallError::RestoreFailed);
    if (restore.coordinator != nullptr) {
        log_(Level::Default, "%s|Cancelling coordinator for appBundleIdentifier:%{public}@",
             identifier);
        restore.coordinator->cancelForReason(reason, SyncClientID);
    }
    if (restore.refusedPlaceholder != nullptr) {
        log_(Level::Default, "%s|Cancelling placeholder for appBundleIdentifier:%{public}@",
             identifier);
        restore.refusedPlaceholder->cancelForReason(reason, SyncClientID);
    }
    relocantCancelledCoordinatorForRestoreAppBundle(identifier);
}

std::shared_ptr<InstallPlaceholder> AppsClient::_placeHolderForBundleIdentifierWithVessikMetadata(
    const std::string& identifier, const PropertyList& vessikMetadata, const Bytes* sinfData,
    const Bytes* iconData, std::uint64_t demotionStatus) {
    const std::string directory = placeholderAppPathForBundleIdentifier(identifier);
    if (!createPlaceHolderPath(directory, identifier, placeholderFileAttributes())) return nullptr;
    const std::string iconPath = formatPath(kInDirectoryFormat, {directory, kPlaceholderIconFile});
    std::uint64_t iconSize = 0;
    writeIconData(iconData, iconPath, &iconSize, identifier, placeholderFileAttributes());

    const std::string* title = displayTitleOf(vessikMetadata);
    auto placeholder = _placeHolderForBundleIdentifier(
        identifier, title != nullptr ? *title : identifier, installTypeFor(demotionStatus));
    if (placeholder == nullptr) return nullptr;
    const bool isFilled = addRestoreIcon(identifier, iconPath, iconSize, *placeholder) &&
                          setAttributes(log_, *placeholder, identifier, vessikMetadata) &&
                          setStoreMetadata(log_, *placeholder, identifier, vessikMetadata) &&
                          setSinf(log_, *placeholder, identifier, sinfData) &&
                          setComplete(log_, *placeholder, identifier);
    if (isFilled) return placeholder;
    placeholder->cancelForReason(makeInstallError(InstallError::RestoreFailed), SyncClientID);
    return nullptr;
}

bool AppsClient::addRestoreIcon(const std::string& identifier, const std::string& path,
                                std::uint64_t size, InstallPlaceholder& placeholder) {
    if (size == 0) return true;
    return _createIconPromiseForBundleIdentifier(identifier, path, size, &placeholder, false) !=
           nullptr;
}

}  // namespace appsync
