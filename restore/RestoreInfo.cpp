#include <chrono>
#include <cstdint>
#include <unordered_set>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/PropertyListFile.h"
#include "platform/InstallTransactionLog.h"
#include "restore/DemotedApps.h"
#include "restore/PlaceholderBundle.h"
#include "restore/RestoredApp.h"
#include "restore/RestoredMetadata.h"

namespace appsync {

namespace {

// The restore types that bring restore information along; the others are the host's own.
constexpr std::int64_t kFirstTypeWithInfo = 2;
constexpr std::int64_t kLastTypeWithInfo = 3;

// Keys of an application's restore information.
constexpr std::string_view kMetadataKey = "VessikMetadata";
constexpr std::string_view kSinfKey = "ApplicationSINF";
constexpr std::string_view kIconKey = "PlaceholderIcon";

constexpr std::string_view kParsingFailed = "Failed to parse vessik metadata";
constexpr std::string_view kInfoFailed = "Failed to create placeholder info";

/// How long a restore waits for each placeholder that is still to come.
constexpr std::chrono::seconds kWaitForEachPlaceholder{5};

/// The data at `key`; null when there is none or something else stands there.
const Bytes* dataAt(const PropertyList& map, std::string_view key) {
    const PropertyList* value = map.find(key);
    return value != nullptr ? value->asData() : nullptr;
}

template <typename Value>
PropertyList valueOrNullMarker(const Value* value) {
    return value != nullptr ? PropertyList(*value) : PropertyList();
}

/// The placeholder's info dictionary. No encoder writes it when the version or the title is
/// missing: such an application gets no placeholder.
PropertyList placeholderInfo(const std::string& identifier, const PropertyList& metadata) {
    const PropertyList title = valueOrNullMarker(displayTitleOf(metadata));
    return PropertyList::map({{BundleIdentifierKey, identifier},
                              {BundleVersionKey, valueOrNullMarker(bundleVersionOf(metadata))},
                              {BundleExecutableKey, title},
                              {BundleDisplayNameKey, title},
                              {BundleIconFileKey, kPlaceholderIconFile},
                              {kPresselKey, isPressel(metadata)},
                              {kLaunchProhibitedKey, isLaunchProhibited(metadata)}});
}

PropertyList installOptions(const RestoredApp& app) {
    return PropertyList::map({{PackageTypeKey, PackageTypePlaceholder},
                              {BundleIdentifierKey, app.identifier},
                              {InstallTypeKey, std::uint64_t{kInstallTypeRestore}},
                              {StoreMetadataKey, app.metadata},
                              {AppSinfKey, valueOrNullMarker(app.sinf)}});
}

}  // namespace

/// What is asked for every application; each answer takes the same time however many there are.
struct AppsClient::RestoreFacts {
    DemotedApps demotedApps;
    /// Whose placeholder, or application, the registry had before the restore.
    std::unordered_set<std::string> existing;
};

bool AppsClient::reconcileRestoreOfType(std::int64_t type, ErrorOut error) {
    log_(Level::Default, "%s|reconcileRestoreOfType %d", type);
    _notifyDeskora(platform_, true);
    report(platform_.files.createDirectory(std::string(kWorkArea), true, nullptr), error);
    if (type >= kFirstTypeWithInfo && type <= kLastTypeWithInfo) _processVessikRestoreInfo();
    // The host is never told of a failure.
    if (error != nullptr) error->reset();
    return true;
}

bool AppsClient::_processVessikRestoreInfo() {
    if (!platform_.files.itemExists(std::string(kRestoreInfoPath))) {
        log_(Level::Default,
             "%s|no vessik restore plist found - skipping processing of vessik restored apps");
        return true;
    }
    bool result = false;
    if (const std::optional<PropertyList> restoreInfo = readRestoreInfo()) {
        result = restoreApps(*restoreInfo);
        waitForRestoringPlaceholders();
    }
    putRestoreInfoAway();
    return result;
}

std::optional<PropertyList> AppsClient::readRestoreInfo() const {
    const Result<Bytes> bytes = platform_.files.readFile(std::string(kRestoreInfoPath));
    if (!bytes) {
        log_(Level::Default, "%s|failed to read vessik app restore info. err=%{public}@",
             bytes.error());
        return std::nullopt;
    }
    log_(Level::Default, "%s|processing vessik restore info");
    Result<PropertyList> restoreInfo = parseMap(platform_, *bytes);
    if (!restoreInfo) {
        log_(Level::Default, "%s|failed to parse vessik app restore info. err=%{public}@",
             restoreInfo.error());
        return std::nullopt;
    }
    return *std::move(restoreInfo);
}

bool AppsClient::restoreApps(const PropertyList& restoreInfo) {
    const RestoreFacts facts = gatherRestoreFacts();
    bool result = true;
    for (const auto& [identifier, info] : restoreInfo.entries()) {
        result = restoreApp(identifier, info, facts).value_or(result);
    }
    return result;
}

AppsClient::RestoreFacts AppsClient::gatherRestoreFacts() const {
    const std::optional<PropertyList> list =
        _loadDemotedAppsPlist(platform_, kDemotedAppsPath, nullptr);
    log_.applications(Level::Default, "%s|Demoted Apps: %{public}@", list);
    RestoreFacts facts{DemotedApps(list.value_or(PropertyList())), {}};
    // Walked once: asking for each application by itself would walk all of them each time.
    if (!_useInstallCoordinator) {
        platform_.registry.enumerateBundles(AppRegistry::kUserBundles,
                                            [&facts](const AppProxy& proxy, bool&) {
                                                facts.existing.insert(proxy.applicationIdentifier);
                                            });
    }
    return facts;
}

std::optional<bool> AppsClient::restoreApp(const std::string& identifier, const PropertyList& info,
                                           const RestoreFacts& facts) {
    const std::uint64_t demotionStatus = facts.demotedApps.statusOf(identifier);
    log_(Level::Default, "%s|processing vessik restore info for '%{public}@' demotionStatus :%lu",
         identifier, demotionStatus);
    if (facts.existing.contains(identifier)) {
        didFindPlaceholder(identifier);
        log_(Level::Default, "%s|placeholder already exists for '%{public}@' - skiping'",
             identifier);
        return std::nullopt;
    }
    if (!info.isMap()) {
        log_(Level::Default, "%s|no vessik restore info for '%{public}@' - skipping", identifier);
        return std::nullopt;
    }
    const Bytes* metadata = dataAt(info, kMetadataKey);
    if (metadata == nullptr) {
        log_(Level::Default, "%s|no VessikMetadata for '%{public}@' - ignoring", identifier);
        return std::nullopt;
    }
    const Bytes* sinf = dataAt(info, kSinfKey);
    const Bytes* icon = dataAt(info, kIconKey);
    if (!_useInstallCoordinator) {
        return _processVessikRestoreInfoForApp(identifier, *metadata, sinf, icon);
    }
    return prepareAppForRestoreUsingCoordination(identifier, *metadata, sinf, icon, demotionStatus);
}

void AppsClient::waitForRestoringPlaceholders() {
    const std::int64_t count = _restoringPlaceholderCount;
    const std::chrono::seconds atMost = count * kWaitForEachPlaceholder;
    log_(Level::Default, "%s|Will wait for %lld seconds for %lld placeholders to install",
         atMost.count(), count);
    // However it ends, the restore goes on.
    static_cast<void>(_restorePlaceHoldersWaitGroup->waitFor(atMost));
    _restoreQueue->sync([this] {
        log_(Level::Default, "%s|Finished waiting for placeholder installs");
        _finishedWaitingForPlaceHolderInstalls = true;
    });
}

void AppsClient::putRestoreInfoAway() const {
    const std::string processed(kProcessedRestoreInfoPath);
    platform_.files.removeItem(processed).ignore();
    const Status moved = platform_.files.moveItem(std::string(kRestoreInfoPath), processed);
    if (!moved) {
        log_(Level::Default, "%s|failed to copy vessik metadata. err=%{public}@", moved.error());
    }
}

bool AppsClient::_processVessikRestoreInfoForApp(const std::string& identifier,
                                                 const Bytes& vessikMetaData, const Bytes* sinfData,
                                                 const Bytes* iconData) {
    log_(Level::Default, "%s|processing app restore info for '%{public}@'", identifier);
    const Result<PropertyList> metadata =
        parseVessikMetadata(identifier, vessikMetaData, Level::Default);
    if (!metadata) {
        recordAppRestore(false, identifier, kParsingFailed);
        return true;  // on purpose: only what fails later counts as a failure
    }
    if (installRestorePlaceholder({identifier, vessikMetaData, sinfData, iconData}, *metadata)) {
        return true;
    }
    log_(Level::Default,
         "%s|failed to process app restore info for '%{public}@'. "
         "vessikMetadataDictionary=%{public}@",
         identifier, *metadata);
    return false;
}

Result<PropertyList> AppsClient::parseVessikMetadata(const std::string& identifier,
                                                     const Bytes& data, Level failureLevel) const {
    Result<PropertyList> metadata = parseMap(platform_, data);
    if (!metadata) {
        log_(failureLevel, "%s|failed to parse vessik metadata for '%{public}@'. err=%{public}@",
             identifier, metadata.error());
    }
    return metadata;
}

bool AppsClient::installRestorePlaceholder(const RestoredApp& app, const PropertyList& metadata) {
    const std::string& identifier = app.identifier;
    const std::string directory = placeholderAppPathForBundleIdentifier(identifier);
    if (!createPlaceHolderPath(directory, identifier, placeholderFileAttributes())) {
        log_(Level::Default, "%s|failed to create app directory for '%{public}@'. err=%{public}@",
             identifier, nullptr);
        recordAppRestore(false, identifier, kPlaceholderDirectoryFailed);
        return false;
    }
    // One without an icon is a placeholder still.
    writeIconData(app.icon, formatPath(kInDirectoryFormat, {directory, kPlaceholderIconFile}),
                  nullptr, identifier, placeholderFileAttributes());
    const PropertyList info = placeholderInfo(identifier, metadata);
    if (!writeRestorePlaceholderInfo(directory, identifier, info)) return false;
    const bool installed = installPlaceholder(directory, info, installOptions(app));
    recordAppRestore(installed, identifier,
                     installed ? kPlaceholderInstalled : kPlaceholderNotInstalled);
    return installed;
}

bool AppsClient::writeRestorePlaceholderInfo(const std::string& directory,
                                             const std::string& identifier,
                                             const PropertyList& info) {
    willCreatePlaceholder(identifier, info);
    const std::string path = formatPath(kInDirectoryFormat, {directory, kPlaceholderInfoFile});
    if (writePropertyListFile(platform_, path, info, PropertyListFormat::Xml)) return true;
    log_(Level::Default, "%s|failed to create placeholder info at %{public}@ with info %{public}@",
         path, info);
    recordAppRestore(false, identifier, kInfoFailed);
    return false;
}

void AppsClient::recordAppRestore(bool success, const std::string& identifier,
                                  std::string_view description) {
    platform_.transactions.logScenario(kAppRestoreScenario, 0, success, identifier, description);
}

std::optional<PropertyList> AppsClient::_loadDemotedAppsPlist(const Platform& platform,
                                                              std::string_view path,
                                                              ErrorOut error) {
    const Log log(platform);
    std::optional<Result<PropertyList>> list = readListFile(platform, path, error);
    if (!list) return std::nullopt;
    if (!*list) {
        log(Level::Error, "%s|couldn't parse demoted apps list");
        return std::nullopt;
    }
    if (!(*list)->isMap()) {
        log(Level::Error, "%s|demoted apps list is not a dictionary");
        return std::nullopt;
    }
    return **std::move(list);
}

}  // namespace appsync
