#include "client/AppsClient.h"
#include "client/PropertyListFile.h"
#include "client/StoreMetadataFile.h"

namespace appsync {

namespace {

constexpr std::string_view kAutoDownloadKey = "is-auto-download";

void clearAutoDownload(const Platform& platform, const AppProxy& proxy) {
    const std::string path = storeMetadataPath(proxy);
    std::optional<PropertyList> metadata = readMapFile(platform, path);
    if (!metadata || !metadata->findFlag(kAutoDownloadKey)) return;
    metadata->erase(kAutoDownloadKey);
    const Log log(platform);
    log(Level::Default, "%s|clearing is-auto-download value for %{public}@",
        proxy.applicationIdentifier);
    writePropertyListFile(platform, path, *metadata, PropertyListFormat::Xml).ignore();
}

}  // namespace

void AppsClient::prepareForBackup() {
    log_(Level::Default, "%s|preparing for backup");
    platform_.registry.enumerateBundles(
        AppRegistry::kUserBundles,
        [this](const AppProxy& proxy, bool&) { clearAutoDownload(platform_, proxy); });
    log_(Level::Default, "%s|finished preparing for backup");
}

}  // namespace appsync
