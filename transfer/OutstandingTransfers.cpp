#include <cstddef>
#include <utility>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/PropertyListFile.h"
#include "client/TodoList.h"
#include "transfer/TransferAsset.h"
#include "transfer/TransferItem.h"
#include "transfer/WantedTransfers.h"

namespace appsync {

namespace {

constexpr std::size_t kInitialCapacity = 16;

/// The display name in the info dictionary of the bundle at the path.
std::optional<std::string> displayNameOfBundle(const Platform& platform,
                                               const std::string& bundlePath) {
    const auto info = readMapFile(platform, formatPath(kInfoFormat, {bundlePath}));
    const std::string* name = info ? info->findString(BundleDisplayNameKey) : nullptr;
    return name != nullptr ? std::optional(*name) : std::nullopt;
}

void emptyIconDirectory(const Platform& platform) {
    const std::string directory(kIconDirectory);
    platform.files.removeItem(directory).ignore();
    const Status created = platform.files.createDirectory(directory, false, nullptr);
    if (!created) {
        const Log log(platform);
        log(Level::Error, "%s|Can't create icon scratch dir! %{public}@", created.error());
    }
}

bool isExistingApp(AppRegistry& registry, const std::string& identifier) {
    const auto proxy = registry.proxyForIdentifier(identifier, AppRegistry::Placeholders::Excluded);
    return proxy && proxy->state.installed && !proxy->state.placeholder;
}

bool createMissingPlaceholder(AppsClient& client, const Log& log, const SyncAsset& asset,
                              const WantedTransfers& wants) {
    if (wants.hasPlaceholder(asset.identifier)) {
        log(Level::Default,
            "%s|Not creating a placeholder app for %{public}@ because we already have one",
            asset.identifier);
        return false;
    }
    client._createPlaceHolderApplication(asset);
    return true;
}

}  // namespace

std::vector<SyncAssetPointer> AppsClient::outstandingAssetTransfers() {
    std::vector<SyncAssetPointer> result;
    result.reserve(kInitialCapacity);
    WantedTransfers wants(*this, platform_, _useInstallCoordinator, _kolmAppsToIgnore);
    const std::vector<PropertyList> items = wants.takeItems();
    emptyIconDirectory(platform_);
    for (const PropertyList& item : items) {
        SyncAssetPointer asset = prepareAsset(item, wants);
        if (asset != nullptr) result.push_back(std::move(asset));
    }
    return result;
}

SyncAssetPointer AppsClient::prepareAsset(const PropertyList& itemMap,
                                          const WantedTransfers& wants) {
    TransferItem item = TransferItem::fromItemMap(itemMap);
    item.displayName = displayNameOfBundle(platform_, item.bundlePath);
    if (wants.isSkipped(item)) return nullptr;
    SyncAssetPointer asset = makeTransferAsset(*this, platform_, item);
    const bool isWanted = _useInstallCoordinator
                              ? prepareCoordinator(*asset)
                              : createMissingPlaceholder(*this, log_, *asset, wants);
    return isWanted ? asset : nullptr;
}

bool AppsClient::prepareCoordinator(const SyncAsset& asset) {
    const std::string& identifier = asset.identifier;
    const bool existingApp = isExistingApp(platform_.registry, identifier);
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

}  // namespace appsync
