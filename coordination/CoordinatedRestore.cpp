#include "coordination/CoordinatedRestore.h"

#include <cstdint>
#include <utility>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "coordination/InstallErrors.h"
#include "coordination/InstallSteps.h"
#include "coordination/PlaceholderAttributesMap.h"
#include "platform/InstallCoordinatorService.h"
#include "restore/PlaceholderBundle.h"
#include "restore/RestoredMetadata.h"

namespace appsync {

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

// The pieces of a placeholder. Whether the placeholder took it is the answer.

bool setAttributes(PieceLog& pieces, InstallPlaceholder& placeholder,
                   const PropertyList& metadata) {
    const PlaceholderAttributes attributes = attributesFrom(metadata);
    return pieces.note(placeholder.setAttributes(attributes),
                       "%s|set %{public}@ placeholder attributes for %{public}@",
                       "%s|Error %{public}@ setting placeholder attributes for '%{public}@'",
                       mapOf(attributes));
}

bool setStoreMetadata(PieceLog& pieces, InstallPlaceholder& placeholder,
                      const PropertyList& metadata) {
    return pieces.note(placeholder.setMetadata(StoreMetadata{metadata}),
                       "%s|set store metadata on placeholder for %{public}@",
                       "%s|Error %{public}@ setting store metadata for '%{public}@'");
}

bool setSinf(PieceLog& pieces, InstallPlaceholder& placeholder, const Bytes* sinf) {
    if (sinf == nullptr) return true;
    return pieces.note(placeholder.setSinf(*sinf), "%s|set SINF data on placeholder for %{public}@",
                       "%s|Error %{public}@ setting SINF data for '%{public}@'");
}

bool setComplete(PieceLog& pieces, InstallPlaceholder& placeholder) {
    return pieces.note(
        placeholder.setConfigurationComplete(),
        "%s|set placeholder configuration complete for %{public}@",
        "%s|Error %{public}@ setting placeholder configuration as complete for '%{public}@'");
}

}  // namespace

CoordinatedRestore::CoordinatedRestore(AppsClient& client, const Platform& platform,
                                       const RestoredApp& app)
    : client_(client),
      platform_(platform),
      log_(platform),
      app_(app),
      pieces_(log_, app.identifier) {}

bool CoordinatedRestore::runDemoted() {
    const std::string& identifier = app_.identifier;
    log_(Level::Default,
         "%s|processing app restore for demoted bundle '%{public}@' with install coordination",
         identifier);
    logStepStart(platform_.transactions, InstallStep::Restore, identifier, kRestoreDemotedApp);
    const bool status = begin(CoordinatorKind::RestoringDemoted) && addPromises();
    log_(Level::Default,
         "%s|processing app restore for demoted app %{public}@ finished with status %d error "
         "%{public}@",
         identifier, status, pieces_.lastError());
    logStepEnd(platform_.transactions, InstallStep::Restore, status, identifier,
               kRestoreDemotedApp);
    if (!status) giveUp();
    return status;
}

bool CoordinatedRestore::runNonDemoted() {
    const std::string& identifier = app_.identifier;
    log_(Level::Default,
         "%s|processing app restore for non demoted bundle '%{public}@' with install coordination",
         identifier);
    logStepStart(platform_.transactions, InstallStep::Restore, identifier, kRestoreApp);
    const bool hasBegun = begin(CoordinatorKind::Restoring);
    if (hasBegun && isLeftToAppStore()) {
        logStepEnd(platform_.transactions, InstallStep::Restore, true, identifier, kRestoreApp);
        return true;
    }
    const bool status = hasBegun && addPromises() && leaveToAppStore();
    log_(Level::Default,
         "%s|processing app restore for %{public}@ finished with status %d error %{public}@",
         identifier, status, pieces_.lastError());
    logStepEnd(platform_.transactions, InstallStep::Restore, status, identifier, kRestoreApp);
    if (!status) giveUp();
    return status;
}

/// Gets what the restore goes by: the metadata and a coordinator.
bool CoordinatedRestore::begin(CoordinatorKind kind) {
    if (!readMetadata()) return false;
    auto found = platform_.coordination.coordinator(
        kind, app_.identifier, SyncClientID,
        InstallCoordinatorService::Creation::CreateIfNotExisting);
    coordinator_ = std::move(found.coordinator);
    pieces_.lastError() = std::move(found.error);
    // One of another client's is not touched: it counts as none.
    if (coordinator_ != nullptr && coordinator_->creatorIdentifier() != SyncClientID) {
        coordinator_.reset();
    }
    if (coordinator_ != nullptr) return true;
    log_(Level::Error, "%s|Error %{public}@ creating restore coordinator for %{public}@",
         pieces_.lastError(), app_.identifier);
    return false;
}

bool CoordinatedRestore::readMetadata() {
    Result<PropertyList> metadata =
        parseRestoredMetadata(platform_, app_.identifier, app_.metadata, Level::Error);
    if (!metadata) {
        pieces_.lastError() = metadata.error();
        return false;
    }
    metadata_ = *std::move(metadata);
    return true;
}

bool CoordinatedRestore::isLeftToAppStore() const {
    const auto responsible = coordinator_->appAssetPromiseResponsibleClient();
    if (responsible != AppStoreClientID) return false;
    log_(Level::Default,
         "%s|App asset DRI for %{public}@ is set to %lu - nothing more for trd to do",
         app_.identifier, *responsible);
    return true;
}

bool CoordinatedRestore::addPromises() {
    coordinator_->setObserver(client_.weak_from_this());
    return addUserDataPromise() && addPlaceholder();
}

bool CoordinatedRestore::addUserDataPromise() {
    if (coordinator_->hasUserDataPromise()) {
        log_(Level::Default, "%s|Coordinator for %{public}@ has a valid user data promise",
             app_.identifier);
        return true;
    }
    const auto promise = client_._userDataPromiseForBundleIdentifier(app_.identifier);
    if (promise == nullptr) return true;  // the restore goes on without it
    return pieces_.note(coordinator_->setUserDataPromise(promise),
                        "%s|Added out of band user data promise for for %{public}@",
                        "%s|Error %{public}@ adding out of band data promise for '%{public}@'");
}

bool CoordinatedRestore::addPlaceholder() {
    if (coordinator_->hasPlaceholderPromise()) {
        log_(Level::Default, "%s|Coordinator for %{public}@ has a valid placeholder promise",
             app_.identifier);
        return true;
    }
    auto placeholder = client_._placeHolderForBundleIdentifierWithVessikMetadata(
        app_.identifier, metadata_, app_.sinf, app_.icon, app_.demotionStatus);
    if (placeholder == nullptr) return false;
    if (!pieces_.isTaken(coordinator_->setPlaceholderPromise(placeholder),
                         "%s|Error %{public}@ setting placeholder promise for '%{public}@'")) {
        refusedPlaceholder_ = std::move(placeholder);
        return false;
    }
    client_.relocantSetPlaceHolderPromiseForRestoreAppBundle(app_.identifier);
    log_(Level::Default, "%s|added placeholder promise for %{public}@", app_.identifier);
    return true;
}

bool CoordinatedRestore::leaveToAppStore() {
    return pieces_.note(
        coordinator_->setAppAssetPromiseResponsibleClient(AppStoreClientID),
        "%s|set CQClientAppStore to satisfy app asset promise for %{public}@",
        "%s|Error %{public}@ setting CQClientAppStore to satisfy app data promise for "
        "'%{public}@'");
}

/// Cancels the coordinator, then a placeholder that it did not take (an install does the reverse),
/// and stops awaiting it.
void CoordinatedRestore::giveUp() {
    const std::string& identifier = app_.identifier;
    const ErrorRecord reason = makeInstallError(InstallError::RestoreFailed);
    if (coordinator_ != nullptr) {
        log_(Level::Default, "%s|Cancelling coordinator for appBundleIdentifier:%{public}@",
             identifier);
        coordinator_->cancelForReason(reason, SyncClientID);
    }
    if (refusedPlaceholder_ != nullptr) {
        log_(Level::Default, "%s|Cancelling placeholder for appBundleIdentifier:%{public}@",
             identifier);
        refusedPlaceholder_->cancelForReason(reason, SyncClientID);
    }
    client_.relocantCancelledCoordinatorForRestoreAppBundle(identifier);
}

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
    const RestoredApp app{identifier, vessikMetadata, sinfData, iconData, demotionStatus};
    return CoordinatedRestore(*this, platform_, app).runDemoted();
}

bool AppsClient::_prepareNonDemotedAppForRestoreWithBundleId(const std::string& identifier,
                                                             const Bytes& vessikMetadata,
                                                             const Bytes* sinfData,
                                                             const Bytes* iconData) {
    const RestoredApp app{identifier, vessikMetadata, sinfData, iconData, kNotDemoted};
    return CoordinatedRestore(*this, platform_, app).runNonDemoted();
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
    const auto addIcon = [&] {
        return _createIconPromiseForBundleIdentifier(identifier, iconPath, iconSize,
                                                     placeholder.get(), false) != nullptr;
    };
    PieceLog pieces(log_, identifier);
    const bool isFilled =
        (iconSize == 0 || addIcon()) && setAttributes(pieces, *placeholder, vessikMetadata) &&
        setStoreMetadata(pieces, *placeholder, vessikMetadata) &&
        setSinf(pieces, *placeholder, sinfData) && setComplete(pieces, *placeholder);
    if (isFilled) return placeholder;
    placeholder->cancelForReason(makeInstallError(InstallError::RestoreFailed), SyncClientID);
    return nullptr;
}

}  // namespace appsync
