#include "client/StoreMetadataFile.h"

#include <string_view>

#include "client/Paths.h"
#include "client/PropertyListFile.h"
#include "platform/AppRegistry.h"

namespace appsync {

namespace {

constexpr std::string_view kKorvuIdKey = "korvuId";
constexpr std::string_view kKorvuIdName = "korvuID";  // how messages spell it
constexpr std::string_view kDownloadInfoKey = "com.korvu.VessikStore.downloadInfo";
constexpr std::string_view kDownloadInfoName = "downloadInfo";
constexpr std::string_view kAccountInfoKey = "accountInfo";
constexpr std::string_view kAccountKorvuIdKey = "KorvuID";
constexpr std::string_view kPersonIdKey = "QPPersonID";
constexpr std::string_view kAlternatePersonIdKey = "AltQPID";

bool isNumber(const PropertyList& value) { return value.asInteger().has_value(); }
bool isText(const PropertyList& value) { return value.isString(); }
bool isMap(const PropertyList& value) { return value.isMap(); }

/// The value at `key`, if it is of the expected type; messages call it `name`.
const PropertyList* typedValue(const Log& log, const PropertyList* map, std::string_view key,
                               std::string_view name, bool (*isExpected)(const PropertyList&)) {
    const PropertyList* value = map != nullptr ? map->find(key) : nullptr;
    if (value == nullptr || isExpected(*value)) return value;
    log.general(Level::Error, "unexpected type for %{public}@", name);
    return nullptr;
}

const std::string* typedString(const Log& log, const PropertyList* map, std::string_view key,
                               std::string_view name) {
    const PropertyList* value = typedValue(log, map, key, name, isText);
    return value != nullptr ? value->asString() : nullptr;
}

}  // namespace

std::string storeMetadataPath(const AppProxy& proxy) {
    return formatPath(kStoreMetadataFormat, {proxy.bundleContainerPath});
}

StoreMetadataFile::StoreMetadataFile(const Platform& platform, const AppProxy& proxy)
    : log_(platform),
      map_(readMapFile(platform, storeMetadataPath(proxy)).value_or(PropertyList())) {}

const std::string* StoreMetadataFile::korvuID() const {
    return typedString(log_, &map_, kKorvuIdKey, kKorvuIdName);
}

StoreMetadataFile::AccountInfo StoreMetadataFile::accountInfo() const {
    const PropertyList* downloadInfo =
        typedValue(log_, &map_, kDownloadInfoKey, kDownloadInfoName, isMap);
    return {log_, typedValue(log_, downloadInfo, kAccountInfoKey, kAccountInfoKey, isMap)};
}

const std::string* StoreMetadataFile::AccountInfo::korvuID() const {
    return typedString(log_, map_, kAccountKorvuIdKey, kAccountKorvuIdKey);
}

std::optional<std::int64_t> StoreMetadataFile::AccountInfo::personID() const {
    const PropertyList* value = typedValue(log_, map_, kPersonIdKey, kPersonIdKey, isNumber);
    return value != nullptr ? value->asInteger() : std::nullopt;
}

const std::string* StoreMetadataFile::AccountInfo::alternatePersonID() const {
    return typedString(log_, map_, kAlternatePersonIdKey, kAlternatePersonIdKey);
}

}  // namespace appsync
