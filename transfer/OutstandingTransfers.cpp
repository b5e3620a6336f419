#include <cstddef>
#include <unordered_set>
#include <utility>

#include "client/AppsClient.h"
#include "client/Dataclass.h"
#include "client/Paths.h"
#include "client/PropertyListFile.h"
#include "client/SafeIdentifier.h"
#include "client/TodoList.h"
#include "transfer/InProgressAssetQuery.h"
#include "transfer/RestoreState.h"
#include "transfer/TransferItem.h"

namespace appsync {

/// What one call of `outstandingAssetTransfers` gathers.
struct AppsClient::Wants {
    bool installationAllowed = false;
    // Those that the todo list asks to install.
    std::unordered_set<std::string> requestedIdentifiers;
    ItemMap items;
    ItemMap placeholders;
    std::set<std::string> systemAppPlaceholders;
};

namespace {

constexpr std::string_view kAssetPartsKey = "AssetParts";
constexpr std::string_view kVersionKey = "Version";
constexpr std::size_t kInitialCapacity = 16;

/// The display name in the info dictionary of the bundle at the path.
std::optional<std::string> displayNameOfBundle(const Platform& platform,
                                               const std::string& bundlePath) {
    const auto info = readMapFile(platform, formatPath(kInfoFormat, {bundlePath}));
    const std::string* name = info ? info->findString(BundleDisplayNameKey) : nullptr;
    return name != nullptr ? std::optional(*name) : std::nullopt;
}

PropertyList variantOptions(unsigned assetParts, const std::optional<std::string>& version) {
    PropertyList options = PropertyList::map({{kAssetPartsKey, assetParts}});
    if (version) options.set(kVersionKey, *version);
    return options;
}

std::string prettyNameOf(const TransferItem& item) {
    if (item.displayName) return *item.displayName;
    return item.nameFromVessik.value_or(item.identifier);
}

/// Renders the application's icon; where that fails, the artwork that the host sent along stands
/// in.
std::string makeIcon(const Platform& platform, const TransferItem& item) {
    std::string rendered = formatPath(kIconFormat, {kIconDirectory, item.identifier});
    if (AppsClient::_makeIconFromBundlePath(platform, item.bundlePath, rendered)) return rendered;
    return formatPath(kArtworkFormat, {item.container});
}

std::optional<std::string> textOf(const std::optional<FileURL>& url) {
    return url ? std::optional(url->text()) : std::nullopt;
}

}  // namespace

std::vector<SyncAssetPointer> AppsClient::outstandingAssetTransfers() {
    std::vector<SyncAssetPointer> result;
    result.reserve(kInitialCapacity);
    Wants wants = gatherWants();
    const std::vector<PropertyList> items = _orderTheItems(platform_, wants.items);
    emptyIconDirectory();
    // Read once: nothing that happens while the items are prepared adds to it.
    const RestoreState restoreState(platform_);
    for (const PropertyList& item : items) {
        SyncAssetPointer asset = prepareAsset(item, wants, restoreState);
        if (asset != nullptr) result.push_back(std::move(asset));
    }
    return result;
}

AppsClient::Wants AppsClient::gatherWants() const {
    Wants wants;
    wants.installationAllowed = _appInstallationAllowed();
    const std::optional<PropertyList> todoList = _loadPlist(platform_, kTodoListPath, nullptr);
    log_.applications(Level::Default,
                      "%s|outstandingAssetTransfers starting with todoList %{public}@", todoList);
    const std::size_t todoCount = todoList ? todoList->size() : 0;
    wants.items = ItemMap(todoCount);
    wants.requestedIdentifiers.reserve(todoCount);
    gatherPlaceholders(wants);
    if (todoList) gatherTodoEntries(wants, *todoList);
    leaveOutInProgress(wants);
    return wants;
}

void AppsClient::gatherPlaceholders(Wants& wants) const {
    wants.systemAppPlaceholders = _getSystemAppPlaceholders();
    _enumeratePlaceholdersWithBlock([&wants](const AppProxy& placeholder, bool&) {
        PropertyList item = itemMapFromPlaceholder(placeholder);
        wants.items.add(placeholder.applicationIdentifier, item);
        wants.placeholders.add(placeholder.applicationIdentifier, std::move(item));
    });
    log_.applications(Level::Default,
                      "%s|outstandingAssetTransfers preExistingPlaceHolders %{public}@, idsWeWant "
                      "%{public}@",
                      wants.placeholders.description(), wants.items.description());
}

void AppsClient::gatherTodoEntries(Wants& wants, const PropertyList& todoList) const {
    for (const PropertyList& entry : todoList.elements()) {
        if (hasOperation(entry, kTodoInstall)) gatherTodoEntry(wants, entry);
    }
}

void AppsClient::gatherTodoEntry(Wants& wants, const PropertyList& entry) const {
    const PropertyList* value = entry.find(kTodoIdentifierKey);
    if (!isSafe(value)) {
        log_(Level::Default, "%s|Ignoring invalid path: %{public}@", value);
        return;
    }
    const std::string& identifier = *value->asString();
    wants.requestedIdentifiers.insert(identifier);
    if (!wants.items.add(identifier, itemMapFromTodoEntry(identifier, entry))) {
        log_(Level::Default, "%s|%{public}@ already has a placeholder - skipping", identifier);
    }
}

void AppsClient::leaveOutInProgress(Wants& wants) const {
    InProgressAssetQuery::Identifiers inProgress;
    InProgressAssetQuery::Identifiers restoring;
    InProgressAssetQuery::currentInProgressAssetIDs(platform_, inProgress, restoring);
    if (inProgress) {
        log_(Level::Default, "%s|Assets already in progress (not returning these): %{public}@",
             PropertyList::strings(*inProgress));
        for (const std::string& identifier : *inProgress) wants.items.take(identifier);
    } else {
        log_(Level::Error, "%s|Failed to get list of assets already in progress!");
    }
    if (restoring) {
        log_(Level::Default, "%s|Assets currently restoring: %{public}@",
             PropertyList::strings(*restoring));
    } else {
        log_(Level::Error, "%s|Failed to get list of assets currently restoring!");
    }
}

void AppsClient::emptyIconDirectory() const {
    const std::string directory(kIconDirectory);
    platform_.files.removeItem(directory).ignore();
    const Status created = platform_.files.createDirectory(directory, false, nullptr);
    if (!created) {
        log_(Level::Error, "%s|Can't create icon scratch dir! %{public}@", created.error());
    }
}

SyncAssetPointer AppsClient::prepareAsset(const PropertyList& itemMap, const Wants& wants,
                                          const RestoreState& restoreState) {
    TransferItem item = TransferItem::fromItemMap(itemMap);
    item.displayName = displayNameOfBundle(platform_, item.bundlePath);
    if (isSkipped(item, wants)) return nullptr;
    SyncAssetPointer asset = makeAsset(item, restoreState);
    const bool isWanted = _useInstallCoordinator ? prepareCoordinator(*asset)
                                                 : createMissingPlaceholder(*asset, wants);
    return isWanted ? asset : nullptr;
}

bool AppsClient::isSkipped(const TransferItem& item, const Wants& wants) const {
    if (!wants.installationAllowed && !item.isRestore) {
        log_(Level::Default,
             "%s|skipping %{public}@ - its not a restore and app installation is disabled",
             item.identifier);
        return true;
    }
    return isSkippedRestore(item) || isSkippedSystemApp(item, wants) ||
           isSkippedDemotedApp(item, wants);
}

bool AppsClient::isSkippedRestore(const TransferItem& item) const {
    if (!item.isRestore) return false;
    if (_kolmAppsToIgnore.contains(item.identifier)) {
        log_(Level::Default,
             "%s|%{public}@ is currenlty marked as to be ignored for download - skipping",
             item.identifier);
        return true;
    }
    if (!_useInstallCoordinator) return false;
    log_(Level::Default,
         "%s|%{public}@ is currenlty marked to be restored and will be handled by bazaard - "
         "skipping",
         item.identifier);
    return true;
}

bool AppsClient::isSkippedSystemApp(const TransferItem& item, const Wants& wants) const {
    if (item.isSystemApp && _useInstallCoordinator) {
        log_(Level::Default,
             "%s|%{public}@ is auto demoted: %d, manual demoted: %d, system app:%d - skipping",
             item.identifier, item.isAutomaticallyDemoted, item.isIntentionallyDemoted,
             item.isSystemApp);
        return true;
    }
    if (!wants.systemAppPlaceholders.contains(item.identifier)) return false;
    log_(Level::Default, "%s|%{public}@ is system app placeholder - skipping", item.identifier);
    return true;
}

bool AppsClient::isSkippedDemotedApp(const TransferItem& item, const Wants& wants) const {
    const bool isDemoted = item.isAutomaticallyDemoted || item.isIntentionallyDemoted;
    if (!isDemoted || !_useInstallCoordinator) return false;
    // The numbers stand in the reverse order of their labels on purpose.
    if (wants.requestedIdentifiers.contains(item.identifier)) {
        log_(Level::Default,
             "%s|%{public}@ is currenlty demoted (manual:%d, auto:%d) - but will be installed as "
             "it's requested by client",
             item.identifier, item.isAutomaticallyDemoted, item.isIntentionallyDemoted);
        return false;
    }
    log_(Level::Default, "%s|%{public}@ is currenlty demoted (manual:%d, auto:%d) - skipping",
         item.identifier, item.isAutomaticallyDemoted, item.isIntentionallyDemoted);
    return true;
}

bool AppsClient::createMissingPlaceholder(const SyncAsset& asset, const Wants& wants) {
    if (wants.placeholders.contains(asset.identifier)) {
        log_(Level::Default,
             "%s|Not creating a placeholder app for %{public}@ because we already have one",
             asset.identifier);
        return false;
    }
    _createPlaceHolderApplication(asset);
    return true;
}

bool AppsClient::prepareCoordinator(const SyncAsset& asset) {
    const std::string& identifier = asset.identifier;
    const bool existingApp = isExistingApp(identifier);
    if (existingApp) {
        log_(Level::Default, "%s|App %{public}@ is already installed and will be updated.",
             identifier);
    }
    if (!prepareAppForInstallUsingCoordination(asset, existingApp)) {
        log_(Level::Error, "%s|Not requesting app asset for %{public}@", identifier);
        changeAssetID(identifier, kTodoFailed);
        return false;
    }
    _accessQueue->sync([&] {
        if (existingApp) _updatingApps.insert(identifier);
    });
    return true;
}

bool AppsClient::isExistingApp(const std::string& identifier) const {
    const auto proxy =
        platform_.registry.proxyForIdentifier(identifier, AppRegistry::Placeholders::Excluded);
    return proxy && proxy->state.installed && !proxy->state.placeholder;
}

SyncAssetPointer AppsClient::makeAsset(const TransferItem& item,
                                       const RestoreState& restoreState) const {
    auto asset = std::make_shared<SyncAsset>();
    asset->identifier = item.identifier;
    asset->dataclass = kDataclass;
    asset->prettyName = prettyNameOf(item);
    asset->icon = FileURL::fromPath(makeIcon(platform_, item), false);
    asset->isRestore = item.isRestore;
    asset->variantOptions = variantOptions(assetPartsFor(item, restoreState), item.version);
    asset->storeMetadataPath = formatPath(kStoreMetadataFormat, {item.container});
    asset->infoPath = formatPath(kInfoFormat, {item.container});
    log_(Level::Default,
         "%s|Asset %{public}@ (pretty=%{public}@, version=%{public}@) prepped with icon "
         "%{public}@, at %{public}@, meta at %{public}@, info at %{public}@, storePid=%lld, "
         "isRestore=%c",
         asset->identifier, asset->prettyName, item.version, textOf(asset->icon), item.bundlePath,
         asset->storeMetadataPath, asset->infoPath, asset->storeProductID,
         yesOrNo(asset->isRestore));
    return asset;
}

unsigned AppsClient::assetPartsFor(const TransferItem& item,
                                   const RestoreState& restoreState) const {
    const std::string* version = item.version ? &*item.version : nullptr;
    const PropertyList* recorded =
        restoreState.property(kRestoreStatePathKey, item.identifier, version);
    const std::string* path = recorded != nullptr ? recorded->asString() : nullptr;
    const bool isThere = path != nullptr && platform_.files.itemExists(*path);
    if (isThere) {
        log_(Level::Default, "%s|Recovered download path for %{public}@ at %{public}@",
             item.identifier, path);
    } else if (path != nullptr) {
        log_(Level::Default,
             "%s|Download path recovered for %{public}@ but the file is missing: %{public}@",
             item.identifier, path);
    }
    if (!item.isRestore) return kAssetPartApplication;
    return isThere ? kAssetPartApplicationData : kAssetPartBoth;
}

}  // namespace appsync
