#include "transfer/TransferAsset.h"

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "transfer/RestoreState.h"
#include "transfer/TransferItem.h"

namespace appsync {

namespace {

constexpr std::string_view kAssetPartsKey = "AssetParts";
constexpr std::string_view kAssetVersionKey = "Version";

PropertyList variantOptions(unsigned assetParts, const std::optional<std::string>& version) {
    PropertyList options = PropertyList::map({{kAssetPartsKey, assetParts}});
    if (version) options.set(kAssetVersionKey, *version);
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

SyncAssetPointer makeTransferAsset(const AppsClient& client, const Platform& platform,
                                   const TransferItem& item) {
    auto asset = std::make_shared<SyncAsset>();
    asset->identifier = item.identifier;
    asset->dataclass = kApplicationDataclass;
    asset->prettyName = prettyNameOf(item);
    asset->icon = FileURL::fromPath(makeIcon(platform, item), false);
    asset->isRestore = item.isRestore;
    asset->variantOptions = variantOptions(assetPartsFor(client, platform, item), item.version);
    asset->storeMetadataPath = formatPath(kStoreMetadataFormat, {item.container});
    asset->infoPath = formatPath(kInfoFormat, {item.container});
    const Log log(platform);
    log(Level::Default,
        "%s|Asset %{public}@ (pretty=%{public}@, version=%{public}@) prepped with icon "
        "%{public}@, at %{public}@, meta at %{public}@, info at %{public}@, storePid=%lld, "
        "isRestore=%c",
        asset->identifier, asset->prettyName, item.version, textOf(asset->icon), item.bundlePath,
        asset->storeMetadataPath, asset->infoPath, asset->storeProductID,
        yesOrNo(asset->isRestore));
    return asset;
}

unsigned assetPartsFor(const AppsClient& client, const Platform& platform,
                       const TransferItem& item) {
    const Log log(platform);
    const std::string* version = item.version ? &*item.version : nullptr;
    const std::optional<PropertyList> recorded =
        client._restoreStatePropertyForKey(kRestoreStatePathKey, item.identifier, version);
    const std::string* path = recorded ? recorded->asString() : nullptr;
    const bool isThere = path != nullptr && platform.files.itemExists(*path);
    if (isThere) {
        log(Level::Default, "%s|Recovered download path for %{public}@ at %{public}@",
            item.identifier, path);
    } else if (path != nullptr) {
        log(Level::Default,
            "%s|Download path recovered for %{public}@ but the file is missing: %{public}@",
            item.identifier, path);
    }
    if (!item.isRestore) return kAssetPartApplication;
    return isThere ? kAssetPartApplicationData : kAssetPartBoth;
}

}  // namespace appsync
