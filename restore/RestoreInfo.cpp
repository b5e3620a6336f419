#include <chrono>
#include <cstdint>

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

std::optional<PropertyList> readRestoreInfo(const Platform& platform) {
    const Log log(platform);
    const Result<Bytes> bytes = platform.files.readFile(std::string(kRestoreInfoPath));
    if (!bytes) {
        log(Level::Default, "%s|failed to read vessik app restore info. err=%{public}@",
            bytes.error());
        return std::nullopt;
    }
    log(Level::Default, "%s|processing vessik restore info");
    Result<PropertyList> restoreInfo = parseMap(platform, *bytes);
    if (!restoreInfo) {
        log(Level::Default, "%s|failed to parse vessik app restore info. err=%{public}@",
            restoreInfo.error());
        return std::nullopt;
    }
    return *std::move(restoreInfo);
}

void putRestoreInfoAway(const Platform& platform) {
    const std::string processed(kProcessedRestoreInfoPath);
    platform.files.removeItem(processed).ignore();
    const Status moved = platform.files.moveItem(std::string(kRestoreInfoPath), processed);
    if (moved) return;
    const Log log(platform);
    log(Level::Default, "%s|failed to copy vessik metadata. err=%{public}@", moved.error());
}

DemotedApps readDemotedApps(const Platform& platform) {
    const std::optional<PropertyList> list =
        AppsClient::_loadDemotedAppsPlist(platform, kDemotedAppsPath, nullptr);
    const Log log(platform);
    log.applications(Level::Default, "%s|Demoted Apps: %{public}@", list);
    return DemotedApps(list.value_or(PropertyList()));
}

void recordAppRestore(const Platform& platform, bool success, const std::string& identifier,
                      std::string_view description) {
    platform.transactions.logScenario(kAppRestoreScenario, 0, success, identifier, description);
}

bool writeRestorePlaceholderInfo(const Platform& platform, const std::string& directory,
                                 const std::string& identifier, const PropertyList& info) {
    const Log log(platform);
    willCreatePlaceholder(log, identifier, info);
    const std::string path = formatPath(kInDirectoryFormat, {directory, kPlaceholderInfoFile});
    if (writePropertyListFile(platform, path, info, PropertyListFormat::Xml)) return true;
    log(Level::Default, "%s|failed to create placeholder info at %{public}@ with info %{public}@",
        path, info);
    recordAppRestore(platform, false, identifier, kInfoFailed);
    return false;
}

bool installRestorePlaceholder(AppsClient& client, const Platform& platform, const RestoredApp& app,
                               const PropertyList& metadata) {
    const std::string& identifier = app.identifier;
    const std::string directory = client.placeholderAppPathForBundleIdentifier(identifier);
    if (!client.createPlaceHolderPath(directory, identifier, placeholderFileAttributes())) {
        const Log log(platform);
        log(Level::Default, "%s|failed to create app directory for '%{public}@'. err=%{public}@",
            identifier, nullptr);
        recordAppRestore(platform, false, identifier, kPlaceholderDirectoryFailed);
        return false;
    }
    // One without an icon is a placeholder still.
    client.writeIconData(app.icon,
                         formatPath(kInDirectoryFormat, {directory, kPlaceholderIconFile}), nullptr,
                         identifier, placeholderFileAttributes());
    const PropertyList info = placeholderInfo(identifier, metadata);
    if (!writeRestorePlaceholderInfo(platform, directory, identifier, info)) return false;
    const bool installed = installPlaceholder(platform, directory, info, installOptions(app));
    recordAppRestore(platform, installed, identifier,
                     installed ? kPlaceholderInstalled : kPlaceholderNotInstalled);
    return installed;
}

/// Nothing for an application that is passed over.
std::optional<bool> restoreApp(AppsClient& client, const Log& log, bool isCoordinated,
                               const std::string& identifier, const PropertyList& info,
                               std::uint64_t demotionStatus) {
    log(Level::Default, "%s|processing vessik restore info for '%{public}@' demotionStatus :%lu",
        identifier, demotionStatus);
    if (client._placeholderExistsForApplication(identifier)) {
        log(Level::Default, "%s|placeholder already exists for '%{public}@' - skiping'",
            identifier);
        return std::nullopt;
    }
    if (!info.isMap()) {
        log(Level::Default, "%s|no vessik restore info for '%{public}@' - skipping", identifier);
        return std::nullopt;
    }
    const Bytes* metadata = dataAt(info, kMetadataKey);
    if (metadata == nullptr) {
        log(Level::Default, "%s|no VessikMetadata for '%{public}@' - ignoring", identifier);
        return std::nullopt;
    }
    const Bytes* sinf = dataAt(info, kSinfKey);
    const Bytes* icon = dataAt(info, kIconKey);
    if (!isCoordinated) {
        return client._processVessikRestoreInfoForApp(identifier, *metadata, sinf, icon);
    }
    return client.prepareAppForRestoreUsingCoordination(identifier, *metadata, sinf, icon,
                                                        demotionStatus);
}

bool restoreApps(AppsClient& client, const Platform& platform, bool isCoordinated,
                 const PropertyList& restoreInfo) {
    const Log log(platform);
    const DemotedApps demotedApps = readDemotedApps(platform);
    bool result = true;
    for (const auto& [identifier, info] : restoreInfo.entries()) {
        result = restoreApp(client, log, isCoordinated, identifier, info,
                            demotedApps.statusOf(identifier))
                     .value_or(result);
    }
    return result;
}

}  // namespace

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
    if (const std::optional<PropertyList> restoreInfo = readRestoreInfo(platform_)) {
        result = restoreApps(*this, platform_, _useInstallCoordinator, *restoreInfo);
        waitForRestoringPlaceholders();
    }
    putRestoreInfoAway(platform_);
    return result;
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

bool AppsClient::_processVessikRestoreInfoForApp(const std::string& identifier,
                                                 const Bytes& vessikMetaData, const Bytes* sinfData,
                                                 const Bytes* iconData) {
    log_(Level::Default, "%s|processing app restore info for '%{public}@'", identifier);
    const Result<PropertyList> metadata =
        parseRestoredMetadata(platform_, identifier, vessikMetaData, Level::Default);
    if (!metadata) {
        recordAppRestore(platform_, false, identifier, kParsingFailed);
        return true;  // on purpose: only what fails later counts as a failure
    }
    const RestoredApp app{identifier, vessikMetaData, sinfData, iconData};
    if (installRestorePlaceholder(*this, platform_, app, *metadata)) return true;
    log_(Level::Default,
         "%s|failed to process app restore info for '%{public}@'. "
         "vessikMetadataDictionary=%{public}@",
         identifier, *metadata);
    return false;
}

std::optional<PropertyList> AppsClient::_loadDemotedAppsPlist(const Platform& platform,
                                                              std::string_view path,
                                                              ErrorOut error) {
    return readListFile(
        platform, path, &PropertyList::isMap,
        {"%s|couldn't parse demoted apps list", "%s|demoted apps list is not a dictionary"}, error);
}

}  // namespace appsync
