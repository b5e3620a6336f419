#include <cstdint>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/PropertyListFile.h"
#include "platform/IconRenderer.h"
#include "platform/InstallTransactionLog.h"
#include "restore/PlaceholderBundle.h"

namespace appsync {

namespace {

// The directory, below that for temporary files, in which placeholder bundles are built.
constexpr std::string_view kPlaceholderDirectory = "com.korvu.trd.Apps";
constexpr std::string_view kBundleExtension = ".app";

constexpr std::string_view kPlaceholderScenario = "Install placeholder";

constexpr std::string_view kPngType = "public.png";

/// The info dictionary that came with the asset; empty when there is none.
PropertyList infoOf(const Platform& platform, const SyncAsset& asset) {
    if (!asset.infoPath) return PropertyList::map();
    return readMapFile(platform, *asset.infoPath).value_or(PropertyList::map());
}

/// The placeholder's info dictionary. Without a version the asset's has no entry for one.
PropertyList placeholderInfo(const SyncAsset& asset, const PropertyList& assetInfo) {
    PropertyList info = PropertyList::map({{BundleIdentifierKey, asset.identifier}});
    if (const std::string* version = asset.version()) info.set(BundleVersionKey, *version);
    // The same string on purpose: a placeholder has no executable.
    info.set(BundleExecutableKey, *asset.prettyName);
    info.set(BundleDisplayNameKey, *asset.prettyName);
    info.set(BundleIconFileKey, kPlaceholderIconFile);
    info.set(kPresselKey, assetInfo.findFlag(kPresselKey));
    info.set(kLaunchProhibitedKey, assetInfo.findFlag(kLaunchProhibitedKey));
    return info;
}

void copyIcon(const Platform& platform, const SyncAsset& asset, const std::string& directory) {
    if (!asset.icon) return;
    const std::string& source = asset.icon->path();
    const std::string destination =
        formatPath(kInDirectoryFormat, {directory, kPlaceholderIconFile});
    const Status copied = platform.files.copyItem(source, destination);
    if (copied) return;
    const Log log(platform);
    log(Level::Error, "%s|Copying icon from %{public}@ to %{public}@ failed: %{public}@", source,
        destination, copied.error());
}

PropertyList installOptions(const std::string& identifier) {
    return PropertyList::map({{PackageTypeKey, PackageTypePlaceholder},
                              {BundleIdentifierKey, identifier},
                              {InstallTypeKey, std::uint64_t{kInstallTypeSync}}});
}

/// The icon as a PNG image; nothing, and a message, when a step fails.
std::optional<Bytes> encodeIcon(IconRenderer& icons, const IconImage& image, const Log& log) {
    Bytes buffer;
    const auto destination = icons.createImageDestination(kPngType, 1, buffer);
    if (destination == nullptr) {
        log(Level::Error, "%s|couldn't create image");
        return std::nullopt;
    }
    destination->addImage(image);
    if (!destination->finalize()) {
        log(Level::Error, "%s|Couldn't finalize image");
        return std::nullopt;
    }
    return buffer;
}

std::unique_ptr<IconImage> renderIcon(IconRenderer& icons,
                                      const std::optional<std::string>& bundlePath,
                                      const Log& log) {
    if (!bundlePath) {
        log(Level::Error, "%s|missing bundlePath");
        return nullptr;
    }
    const auto url = FileURL::fromPath(*bundlePath, true);
    if (!url) {
        log(Level::Error, "%s|couldn't create URL");
        return nullptr;
    }
    const auto bundle = icons.openBundle(*url);
    if (bundle == nullptr) {
        log(Level::Error, "%s|couldn't create bundle from URL");
        return nullptr;
    }
    auto image = icons.homeScreenIcon(*bundle);
    if (image == nullptr) log(Level::Error, "%s|couldn't create DK icon from bundle");
    return image;
}

bool isUserBundle(const AppProxy& proxy) { return proxy.applicationType != kApplicationTypeSystem; }

/// Whether a walk over the user bundles would meet the identifier, asked by key.
bool hasUserBundle(AppRegistry& registry, const std::string& identifier) {
    using Placeholders = AppRegistry::Placeholders;
    const auto proxy = registry.proxyForIdentifier(identifier, Placeholders::Included);
    if (!proxy || isUserBundle(*proxy)) return proxy.has_value();
    // A system placeholder may cover a user application.
    const auto covered = registry.proxyForIdentifier(identifier, Placeholders::Excluded);
    return covered && isUserBundle(*covered);
}

}  // namespace

std::string AppsClient::placeholderAppPathForBundleIdentifier(const std::string& identifier) const {
    const std::string directory = formatPath(
        kInDirectoryFormat, {platform_.files.temporaryDirectory(), kPlaceholderDirectory});
    return formatPath(kInDirectoryFormat, {directory, identifier}).append(kBundleExtension);
}

bool AppsClient::createPlaceHolderPath(const std::string& path, const std::string& identifier,
                                       const FileAttributes& attributes) {
    const Status created = platform_.files.createDirectory(path, true, &attributes);
    if (!created) {
        platform_.transactions.logScenario(kAppRestoreScenario, 0, false, identifier,
                                           kPlaceholderDirectoryFailed);
    }
    log_(Level::Default,
         "%s|Created app directory for '%{public}@' at %{public}@ with err=%{public}@", identifier,
         path, created ? nullptr : &created.error());
    return created.ok();
}

bool AppsClient::writeIconData(const Bytes* iconData, const std::string& path,
                               std::uint64_t* fileSize, const std::string& identifier,
                               const FileAttributes& attributes) {
    if (iconData == nullptr) {
        log_(Level::Error, "%s|no icon data for '%{public}@'", identifier);
        return false;
    }
    const bool created = platform_.files.createFile(path, *iconData, attributes).ok();
    std::uint64_t size = 0;
    if (created) {
        if (const auto written = platform_.files.attributes(path)) {
            size = written->size;
            if (fileSize != nullptr) *fileSize = size;
        }
    }
    log_(Level::Default,
         "%s|icon data for '%{public}@' was writen to %{public}@ with status:%d fileSize:%llu",
         identifier, path, created, size);
    return created;
}

void AppsClient::_createPlaceHolderApplication(const SyncAsset& asset) {
    log_(Level::Default, "%s|plist %{public}@", asset.infoPath);
    const PropertyList assetInfo = infoOf(platform_, asset);
    if (asset.prettyName.value_or("").empty() || asset.identifier.empty()) return;

    const std::string directory = placeholderAppPathForBundleIdentifier(asset.identifier);
    if (!createPlaceHolderPath(directory, asset.identifier, placeholderFileAttributes())) return;
    copyIcon(platform_, asset, directory);
    const PropertyList info = placeholderInfo(asset, assetInfo);
    const Status written = writePropertyListFile(
        platform_, formatPath(kInDirectoryFormat, {directory, kPlaceholderInfoFile}), info,
        PropertyListFormat::Xml);
    if (!written) return;
    willCreatePlaceholder(log_, asset.identifier, info);
    const bool installed =
        installPlaceholder(platform_, directory, info, installOptions(asset.identifier));
    platform_.transactions.logScenario(
        kPlaceholderScenario, 0, installed, asset.identifier,
        installed ? kPlaceholderInstalled : kPlaceholderNotInstalled);
}

bool AppsClient::_makeIconFromBundlePath(const Platform& platform,
                                         const std::optional<std::string>& bundlePath,
                                         const std::string& destination) {
    const Log log(platform);
    const auto image = renderIcon(platform.icons, bundlePath, log);
    if (image == nullptr) return false;
    const std::optional<Bytes> encoded = encodeIcon(platform.icons, *image, log);
    if (!encoded) return false;
    if (platform.files.writeFileAtomically(destination, *encoded)) return true;
    log(Level::Error, "%s|Couldn't save image file to %{public}@", destination);
    return false;
}

bool AppsClient::_placeholderExistsForApplication(const std::string& identifier) const {
    if (_useInstallCoordinator || !hasUserBundle(platform_.registry, identifier)) return false;
    log_(Level::Default, "%s|Found placeholder for bundle %{public}@", identifier);
    return true;
}

void AppsClient::_enumeratePlaceholdersWithBlock(const AppRegistry::ProxyCallback& callback) const {
    platform_.registry.enumerateBundles(AppRegistry::kEveryBundle,
                                        [&](const AppProxy& proxy, bool& stop) {
                                            if (proxy.state.placeholder) callback(proxy, stop);
                                        });
}

std::set<std::string> AppsClient::_getSystemAppPlaceholders() const {
    std::set<std::string> identifiers;
    platform_.registry.enumerateBundles(AppRegistry::kSystemBundles,
                                        [&](const AppProxy& proxy, bool&) {
                                            if (!proxy.state.placeholder) return;
                                            identifiers.insert(proxy.applicationIdentifier);
                                        });
    log_(Level::Default, "%s|SystemAppPlaceholders %{public}@", listOf(identifiers));
    return identifiers;
}

}  // namespace appsync
