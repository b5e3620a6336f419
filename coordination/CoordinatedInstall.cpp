#include "coordination/CoordinatedInstall.h"

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/PropertyListFile.h"
#include "coordination/InstallErrors.h"
#include "coordination/InstallSteps.h"
#include "coordination/PlaceholderAttributesMap.h"
#include "platform/InstallCoordinatorService.h"
#include "restore/PlaceholderBundle.h"

namespace appsync {

namespace {

constexpr std::string_view kUpdateStarts = "Update app";
constexpr std::string_view kInstallStarts = "Install App";
constexpr std::string_view kInstallEnds = "Install app";  // an update's end too
constexpr std::string_view kCopyingIcon = "Copying icon";
constexpr std::string_view kUninstall = "Uninstall app";

/// A number of the platform's.
constexpr std::uint64_t kInstallTarget = 1;

std::optional<PropertyList> readMap(const Platform& platform,
                                    const std::optional<std::string>& path) {
    return path ? readMapFile(platform, *path) : std::nullopt;
}

StoreMetadata readStoreMetadata(const Platform& platform, const SyncAsset& asset) {
    return {readMap(platform, asset.storeMetadataPath).value_or(PropertyList::map())};
}

bool hasNoName(const SyncAsset& asset) {
    return asset.prettyName.value_or("").empty() && asset.identifier.empty();
}

const ErrorRecord* errorOf(const Status& status) { return status ? nullptr : &status.error(); }

}  // namespace

CoordinatedInstall::CoordinatedInstall(AppsClient& client, const Platform& platform,
                                       const SyncAsset& asset, bool existingApp)
    : client_(client),
      platform_(platform),
      log_(platform),
      asset_(asset),
      info_(readMap(platform, asset.infoPath)),
      storeMetadata_(readStoreMetadata(platform, asset)),
      existingApp_(existingApp),
      pieces_(log_, asset.identifier) {}

bool CoordinatedInstall::run() {
    const std::string& identifier = asset_.identifier;
    log_.applications(
        Level::Default,
        "%s|processing app install for bundle '%{public}@', title %{public}@ assetplist "
        "%{public}@, version %{public}@ with install coordination",
        identifier, asset_.prettyName, info_, asset_.version());
    logStepStart(platform_.transactions, InstallStep::Install, identifier,
                 existingApp_ ? kUpdateStarts : kInstallStarts);
    const bool status = prepare();
    log_(Level::Default,
         "%s|processing app install for bundle %{public}@ finished with status %d error %{public}@",
         identifier, status, pieces_.lastError());
    logStepEnd(platform_.transactions, InstallStep::Install, status, identifier, kInstallEnds);
    if (!status) cancel();
    return status;
}

bool CoordinatedInstall::prepare() {
    if (hasNoName(asset_)) return false;
    coordinator_ = client_._initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
        asset_.identifier, existingApp_, true, &pieces_.lastError());
    if (coordinator_ == nullptr) return false;
    coordinator_->setObserver(client_.weak_from_this());
    if (!addInstallOptions()) return false;
    if (!addODRAssetPromises()) return false;
    if (!addAppAssetPromise()) return false;
    if (coordinator_->hasPlaceholderPromise()) {
        log_(Level::Default, "%s|coordinator for %{public}@ has a placeholder promise",
             asset_.identifier);
        return true;
    }
    makePlaceholder();
    return addPlaceholderPromise();
}

bool CoordinatedInstall::addInstallOptions() {
    if (coordinator_->hasInstallOptions()) {
        log_(Level::Default, "%s|coordinator for %{public}@ has install options",
             asset_.identifier);
        return true;
    }
    storeRecord_ = storeMetadata_;
    return pieces_.note(
        coordinator_->setInstallOptions({storeMetadata_, kInstallTypeSync, kInstallTarget}),
        "%s|set install options on coordinator for %{public}@",
        "%s|Error %{public}@ setting install options on coordinator for '%{public}@'");
}

bool CoordinatedInstall::addODRAssetPromises() {
    if (coordinator_->hasInitialODRAssetPromises()) {
        log_(Level::Default, "%s|coordinator for %{public}@ has an ZEL app asset promise",
             asset_.identifier);
        return true;
    }
    return pieces_.note(coordinator_->setInitialODRAssetPromises({}),
                        "%s|set ZEL asset promise to install coordinator for %{public}@",
                        "%s|Error %{public}@ setting ZEL asset promise for '%{public}@'");
}

bool CoordinatedInstall::addAppAssetPromise() {
    if (coordinator_->appAssetPromise() != nullptr) {
        log_(Level::Default, "%s|coordinator for %{public}@ has an app asset promise",
             asset_.identifier);
        return true;
    }
    // Without a path: the package comes when its transfer ends.
    return client_._createAppAssetPromiseForBundleIdentifier(asset_.identifier, std::nullopt,
                                                             coordinator_.get(),
                                                             &pieces_.lastError()) != nullptr;
}

void CoordinatedInstall::makePlaceholder() {
    const std::string& identifier = asset_.identifier;
    const std::string directory = client_.placeholderAppPathForBundleIdentifier(identifier);
    const std::string iconPath = formatPath(kInDirectoryFormat, {directory, kPlaceholderIconFile});
    std::uint64_t iconSize = 0;
    if (client_.createPlaceHolderPath(directory, identifier, placeholderFileAttributes())) {
        iconSize = copyIcon(iconPath);
    }
    placeholder_ = client_._placeHolderForBundleIdentifier(
        identifier, asset_.prettyName.value_or(identifier), kInstallTypeSync);
    if (placeholder_ == nullptr) return;
    if (iconSize != 0) {
        const auto promise = client_._createIconPromiseForBundleIdentifier(
            identifier, iconPath, iconSize, placeholder_.get(), true, &pieces_.lastError());
        // A placeholder whose icon is refused goes to the coordinator as it is.
        if (promise == nullptr) return;
    }
    configurePlaceholder();
}

/// The size of the copy; 0 when there is none, or it is not known.
std::uint64_t CoordinatedInstall::copyIcon(const std::string& iconPath) {
    if (!asset_.icon) return 0;
    const std::string& identifier = asset_.identifier;
    logStepStart(platform_.transactions, InstallStep::CopyIcon, identifier, kCopyingIcon);
    Status outcome = platform_.files.copyItem(asset_.icon->path(), iconPath);
    std::uint64_t size = 0;
    if (outcome) {
        const Result<ItemAttributes> copy = platform_.files.attributes(iconPath);
        if (copy) {
            size = copy->size;
        } else {
            outcome = copy.error();
        }
        log_(Level::Default, "%s|icon for %{public}@ at %{public}@ has a size of %llu", identifier,
             iconPath, size);
    }
    report(outcome, &pieces_.lastError());
    log_(Level::Default,
         "%s|Copied icon from %{public}@ to %{public}@ with error %{public}@ for '%{public}@', "
         "sizeOnDisk:%llu",
         asset_.icon->path(), iconPath, errorOf(outcome), identifier, size);
    logStepEnd(platform_.transactions, InstallStep::CopyIcon, true, identifier, kCopyingIcon);
    return size;
}

/// Gives the placeholder what it shows. A refusal is only logged, and what follows it left out.
void CoordinatedInstall::configurePlaceholder() {
    if (!setPlaceholderAttributes()) return;
    if (!setPlaceholderMetadata()) return;
    setPlaceholderComplete();
}

bool CoordinatedInstall::setPlaceholderAttributes() {
    PlaceholderAttributes attributes;
    attributes.info = info_.value_or(PropertyList::map());
    attributes.launchProhibited = attributes.info.findFlag(kLaunchProhibitedKey);
    if (const std::string* version = asset_.version()) attributes.bundleVersion = *version;
    return pieces_.note(placeholder_->setAttributes(attributes),
                        "%s|set %{public}@ attributes on placeholder for %{public}@",
                        "%s|Error %{public}@ setting attributes on placeholder for '%{public}@'",
                        mapOf(attributes));
}

bool CoordinatedInstall::setPlaceholderMetadata() {
    return pieces_.note(
        placeholder_->setMetadata(storeRecord_),
        "%s|set store metadata on placeholder for %{public}@",
        "%s|Error %{public}@ setting store metadata on placeholder for '%{public}@'");
}

void CoordinatedInstall::setPlaceholderComplete() {
    pieces_.note(
        placeholder_->setConfigurationComplete(),
        "%s|set placeholder configuration as complete for %{public}@",
        "%s|Error %{public}@ setting placeholder configuration as complete for '%{public}@'");
}

bool CoordinatedInstall::addPlaceholderPromise() {
    isPlaceholderAccepted_ = pieces_.note(
        coordinator_->setPlaceholderPromise(placeholder_),
        "%s|added placeholder promise to coordinator for %{public}@",
        "%s|Error %{public}@ adding placeholder promise to coordinator for '%{public}@'");
    return isPlaceholderAccepted_;
}

/// The placeholder, if no coordinator has it, then the coordinator.
void CoordinatedInstall::cancel() {
    const std::string& identifier = asset_.identifier;
    const ErrorRecord reason = makeInstallError(InstallError::PreparationFailed);
    if (placeholder_ != nullptr && !isPlaceholderAccepted_) {
        log_(Level::Default, "%s|Cancelling placeholder for appBundleIdentifier:%{public}@",
             identifier);
        placeholder_->cancelForReason(reason, SyncClientID);
    }
    if (coordinator_ != nullptr) {
        log_(Level::Default, "%s|Cancelling coordinator for appBundleIdentifier:%{public}@",
             identifier);
        coordinator_->cancelForReason(reason, SyncClientID);
    }
}

bool AppsClient::prepareAppForInstallUsingCoordination(const SyncAsset& asset, bool existingApp) {
    return CoordinatedInstall(*this, platform_, asset, existingApp).run();
}

void AppsClient::uninstallAppUsingCoordination(const std::string& identifier) {
    logStepStart(platform_.transactions, InstallStep::Uninstall, identifier, kUninstall);
    // The client may have gone when the completion comes; the platform has not.
    platform_.coordination.uninstallApp(identifier, [log = log_,
                                                     &transactions = platform_.transactions,
                                                     identifier](const ErrorRecord* error) {
        log(Level::Default,
            "%s|Uninstall of %{public}@ with install coordinator succeeded wiht error "
            "%{public}@.",
            identifier, error);
        logStepEnd(transactions, InstallStep::Uninstall, error == nullptr, identifier, kUninstall);
    });
}

}  // namespace appsync
