#include <utility>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/PropertyListFile.h"
#include "coordination/InstallErrors.h"
#include "coordination/InstallSteps.h"
#include "coordination/PlaceholderAttributesMap.h"
#include "platform/InstallCoordinatorService.h"
#include "restore/PlaceholderBundle.h"

namespace appsync {

/// One run of `prepareAppForInstallUsingCoordination`.
struct AppsClient::Preparation {
    // What the asset says. The info dictionary is absent when it cannot be read.
    const SyncAsset& asset;
    const std::optional<PropertyList> info;
    const StoreMetadata storeMetadata;
    bool existingApp = false;

    // What has been made so far.
    std::shared_ptr<InstallCoordinator> coordinator{};
    // Absent where the coordinator had its install options already.
    std::optional<StoreMetadata> storeRecord{};
    std::shared_ptr<InstallPlaceholder> placeholder{};
    bool isPlaceholderAccepted = false;
    // The last failure of any step.
    std::optional<ErrorRecord> lastError{};

    [[nodiscard]] const std::string& identifier() const { return asset.identifier; }
    /// Whether the step succeeded; if not, keeps its error.
    bool note(const Status& status) {
        if (!status) lastError = status.error();
        return status.ok();
    }
};

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

bool AppsClient::prepareAppForInstallUsingCoordination(const SyncAsset& asset, bool existingApp) {
    const std::string& identifier = asset.identifier;
    Preparation preparation{.asset = asset,
                            .info = readMap(platform_, asset.infoPath),
                            .storeMetadata = readStoreMetadata(platform_, asset),
                            .existingApp = existingApp};
    log_.applications(
        Level::Default,
        "%s|processing app install for bundle '%{public}@', title %{public}@ assetplist "
        "%{public}@, version %{public}@ with install coordination",
        identifier, asset.prettyName, preparation.info, asset.version());
    logStepStart(platform_.transactions, InstallStep::Install, identifier,
                 existingApp ? kUpdateStarts : kInstallStarts);
    const bool status = prepare(preparation);
    log_(Level::Default,
         "%s|processing app install for bundle %{public}@ finished with status %d error %{public}@",
         identifier, status, preparation.lastError);
    logStepEnd(platform_.transactions, InstallStep::Install, status, identifier, kInstallEnds);
    if (!status) cancelPreparation(preparation);
    return status;
}

bool AppsClient::prepare(Preparation& preparation) {
    if (hasNoName(preparation.asset)) return false;
    preparation.coordinator = _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
        preparation.identifier(), preparation.existingApp, true, &preparation.lastError);
    if (preparation.coordinator == nullptr) return false;
    preparation.coordinator->setObserver(weak_from_this());
    if (!addInstallOptions(preparation)) return false;
    if (!addODRAssetPromises(preparation)) return false;
    if (!addAppAssetPromise(preparation)) return false;
    if (preparation.coordinator->hasPlaceholderPromise()) {
        log_(Level::Default, "%s|coordinator for %{public}@ has a placeholder promise",
             preparation.identifier());
        return true;
    }
    makePlaceholder(preparation);
    return addPlaceholderPromise(preparation);
}

bool AppsClient::addInstallOptions(Preparation& preparation) {
    const std::string& identifier = preparation.identifier();
    if (preparation.coordinator->hasInstallOptions()) {
        log_(Level::Default, "%s|coordinator for %{public}@ has install options", identifier);
        return true;
    }
    preparation.storeRecord = preparation.storeMetadata;
    const Status set = preparation.coordinator->setInstallOptions(
        {preparation.storeMetadata, kInstallTypeSync, kInstallTarget});
    if (preparation.note(set)) {
        log_(Level::Default, "%s|set install options on coordinator for %{public}@", identifier);
    } else {
        log_(Level::Error,
             "%s|Error %{public}@ setting install options on coordinator for '%{public}@'",
             set.error(), identifier);
    }
    return set.ok();
}

bool AppsClient::addODRAssetPromises(Preparation& preparation) {
    const std::string& identifier = preparation.identifier();
    if (preparation.coordinator->hasInitialODRAssetPromises()) {
        log_(Level::Default, "%s|coordinator for %{public}@ has an ZEL app asset promise",
             identifier);
        return true;
    }
    const Status set = preparation.coordinator->setInitialODRAssetPromises({});
    if (preparation.note(set)) {
        log_(Level::Default, "%s|set ZEL asset promise to install coordinator for %{public}@",
             identifier);
    } else {
        log_(Level::Error, "%s|Error %{public}@ setting ZEL asset promise for '%{public}@'",
             set.error(), identifier);
    }
    return set.ok();
}

bool AppsClient::addAppAssetPromise(Preparation& preparation) {
    const std::string& identifier = preparation.identifier();
    if (preparation.coordinator->appAssetPromise() != nullptr) {
        log_(Level::Default, "%s|coordinator for %{public}@ has an app asset promise", identifier);
        return true;
    }
    // Without a path: the package comes when its transfer ends.
    return _createAppAssetPromiseForBundleIdentifier(identifier, std::nullopt,
                                                     preparation.coordinator.get(),
                                                     &preparation.lastError) != nullptr;
}

void AppsClient::makePlaceholder(Preparation& preparation) {
    const std::string& identifier = preparation.identifier();
    const std::string directory = placeholderAppPathForBundleIdentifier(identifier);
    const std::string iconPath = formatPath(kInDirectoryFormat, {directory, kPlaceholderIconFile});
    std::uint64_t iconSize = 0;
    if (createPlaceHolderPath(directory, identifier, placeholderFileAttributes())) {
        iconSize = copyIconForPlaceholder(preparation, iconPath);
    }
    preparation.placeholder = _placeHolderForBundleIdentifier(
        identifier, preparation.asset.prettyName.value_or(identifier), kInstallTypeSync);
    if (preparation.placeholder == nullptr) return;
    if (iconSize != 0) {
        const auto promise = _createIconPromiseForBundleIdentifier(identifier, iconPath, iconSize,
                                                                   preparation.placeholder.get(),
                                                                   true, &preparation.lastError);
        // A placeholder whose icon is refused goes to the coordinator as it is.
        if (promise == nullptr) return;
    }
    configurePlaceholder(preparation);
}

/// The size of the copy; 0 when there is none, or it is not known.
std::uint64_t AppsClient::copyIconForPlaceholder(Preparation& preparation,
                                                 const std::string& iconPath) {
    const SyncAsset& asset = preparation.asset;
    if (!asset.icon) return 0;
    logStepStart(platform_.transactions, InstallStep::CopyIcon, asset.identifier, kCopyingIcon);
    Status outcome = platform_.files.copyItem(asset.icon->path(), iconPath);
    std::uint64_t size = 0;
    if (outcome) {
        const Result<ItemAttributes> copy = platform_.files.attributes(iconPath);
        if (copy) {
            size = copy->size;
        } else {
            outcome = copy.error();
        }
        log_(Level::Default, "%s|icon for %{public}@ at %{public}@ has a size of %llu",
             asset.identifier, iconPath, size);
    }
    preparation.note(outcome);
    log_(Level::Default,
         "%s|Copied icon from %{public}@ to %{public}@ with error %{public}@ for '%{public}@', "
         "sizeOnDisk:%llu",
         asset.icon->path(), iconPath, errorOf(outcome), asset.identifier, size);
    logStepEnd(platform_.transactions, InstallStep::CopyIcon, true, asset.identifier, kCopyingIcon);
    return size;
}

/// Gives the placeholder what it shows. A refusal is only logged, and what follows it left out.
void AppsClient::configurePlaceholder(Preparation& preparation) {
    if (!setPlaceholderAttributes(preparation)) return;
    if (!setPlaceholderMetadata(preparation)) return;
    setPlaceholderComplete(preparation);
}

bool AppsClient::setPlaceholderAttributes(Preparation& preparation) {
    const std::string& identifier = preparation.identifier();
    PlaceholderAttributes attributes;
    attributes.info = preparation.info.value_or(PropertyList::map());
    attributes.launchProhibited = attributes.info.findFlag(kLaunchProhibitedKey);
    if (const std::string* version = preparation.asset.version()) {
        attributes.bundleVersion = *version;
    }
    const Status set = preparation.placeholder->setAttributes(attributes);
    if (preparation.note(set)) {
        log_(Level::Default, "%s|set %{public}@ attributes on placeholder for %{public}@",
             mapOf(attributes), identifier);
    } else {
        log_(Level::Error, "%s|Error %{public}@ setting attributes on placeholder for '%{public}@'",
             set.error(), identifier);
    }
    return set.ok();
}

bool AppsClient::setPlaceholderMetadata(Preparation& preparation) {
    const std::string& identifier = preparation.identifier();
    const Status set = preparation.placeholder->setMetadata(preparation.storeRecord);
    if (preparation.note(set)) {
        log_(Level::Default, "%s|set store metadata on placeholder for %{public}@", identifier);
    } else {
        log_(Level::Error,
             "%s|Error %{public}@ setting store metadata on placeholder for '%{public}@'",
             set.error(), identifier);
    }
    return set.ok();
}

void AppsClient::setPlaceholderComplete(Preparation& preparation) {
    const std::string& identifier = preparation.identifier();
    const Status set = preparation.placeholder->setConfigurationComplete();
    if (preparation.note(set)) {
        log_(Level::Default, "%s|set placeholder configuration as complete for %{public}@",
             identifier);
    } else {
        log_(Level::Error,
             "%s|Error %{public}@ setting placeholder configuration as complete for '%{public}@'",
             set.error(), identifier);
    }
}

bool AppsClient::addPlaceholderPromise(Preparation& preparation) {
    const std::string& identifier = preparation.identifier();
    const Status set = preparation.coordinator->setPlaceholderPromise(preparation.placeholder);
    preparation.isPlaceholderAccepted = preparation.note(set);
    if (set) {
        log_(Level::Default, "%s|added placeholder promise to coordinator for %{public}@",
             identifier);
    } else {
        log_(Level::Error,
             "%s|Error %{public}@ adding placeholder promise to coordinator for '%{public}@'",
             set.error(), identifier);
    }
    return set.ok();
}

/// The placeholder, if no coordinator has it, then the coordinator.
void AppsClient::cancelPreparation(const Preparation& preparation) {
    const std::string& identifier = preparation.identifier();
    const ErrorRecord reason = makeInstallError(InstallError::PreparationFailed);
    if (preparation.placeholder != nullptr && !preparation.isPlaceholderAccepted) {
        log_(Level::Default, "%s|Cancelling placeholder for appBundleIdentifier:%{public}@",
             identifier);
        preparation.placeholder->cancelForReason(reason, SyncClientID);
    }
    if (preparation.coordinator != nullptr) {
        log_(Level::Default, "%s|Cancelling coordinator for appBundleIdentifier:%{public}@",
             identifier);
        preparation.coordinator->cancelForReason(reason, SyncClientID);
    }
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
