#include "client/StoreMetadataFile.h"

#include <cstdint>
#include <string_view>
#include <utility>

#include "client/Log.h"
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

bool isNumber(const PropertyList& value) {
    return value.asInteger().has_value() || value.asUnsigned().has_value();
}
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

std::optional<std::string> typedString(const Log& log, const PropertyList* map,
                                       std::string_view key, std::string_view name) {
    const PropertyList* value = typedValue(log, map, key, name, isText);
    return value != nullptr ? std::optional(*value->asString()) : std::nullopt;
}

std::optional<PropertyList> readStoreMetadata(const Platform& platform, const AppProxy& proxy) {
    return readMapFile(platform, storeMetadataPath(proxy));
}

std::optional<std::string> topKorvuID(const Log& log, const PropertyList& metadata) {
    return typedString(log, &metadata, kKorvuIdKey, kKorvuIdName);
}

/// What the download information says of the account; null when there is nothing.
const PropertyList* accountInfoIn(const Log& log, const PropertyList& metadata) {
    const PropertyList* downloadInfo =
        typedValue(log, &metadata, kDownloadInfoKey, kDownloadInfoName, isMap);
    return typedValue(log, downloadInfo, kAccountInfoKey, kAccountInfoKey, isMap);
}

std::optional<std::string> accountKorvuID(const Log& log, const PropertyList* accountInfo) {
    return typedString(log, accountInfo, kAccountKorvuIdKey, kAccountKorvuIdKey);
}

std::optional<PersonIdentifier> personIDIn(const Log& log, const PropertyList* accountInfo) {
    const PropertyList* value = typedValue(log, accountInfo, kPersonIdKey, kPersonIdKey, isNumber);
    if (value == nullptr) return std::nullopt;
    if (const auto number = value->asInteger()) return *number;
    return value->asUnsigned();
}

}  // namespace

std::string storeMetadataPath(const AppProxy& proxy) {
    return formatPath(kStoreMetadataFormat, {proxy.bundleContainerPath});
}

KorvuIDs readKorvuIDs(const Platform& platform, const AppProxy& proxy) {
    const std::optional<PropertyList> metadata = readStoreMetadata(platform, proxy);
    if (!metadata) return {};
    const Log log(platform);
    KorvuIDs ids;
    ids.top = topKorvuID(log, *metadata);
    ids.account = accountKorvuID(log, accountInfoIn(log, *metadata));
    return ids;
}

std::optional<SyncAccountInfo> readAccount(
    const Platform& platform, const AppProxy& proxy,
    const std::function<bool(const std::string& accountID)>& isWanted) {
    const std::optional<PropertyList> metadata = readStoreMetadata(platform, proxy);
    if (!metadata) return std::nullopt;
    const Log log(platform);
    const PropertyList* info = accountInfoIn(log, *metadata);
    std::optional<std::string> identifier = accountKorvuID(log, info);
    if (!identifier) identifier = topKorvuID(log, *metadata);
    if (!identifier || !isWanted(*identifier)) return std::nullopt;

    SyncAccountInfo account;
    account.accountID = *std::move(identifier);
    account.personID = personIDIn(log, info);
    account.alternatePersonID =
        typedString(log, info, kAlternatePersonIdKey, kAlternatePersonIdKey);
    return account;
}

}  // namespace appsync
