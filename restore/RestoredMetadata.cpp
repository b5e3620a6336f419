#include "restore/RestoredMetadata.h"

#include <string_view>

#include "client/Log.h"
#include "client/PropertyListFile.h"
#include "restore/PlaceholderBundle.h"

namespace appsync {

namespace {

constexpr std::string_view kBundleVersionKey = "bundleVersion";
constexpr std::string_view kTitleKey = "title";
constexpr std::string_view kItemNameKey = "itemName";
constexpr std::string_view kLaunchProhibitedFallbackKey = "launchProhibited";

}  // namespace

Result<PropertyList> parseRestoredMetadata(const Platform& platform, const std::string& identifier,
                                           const Bytes& data, LogLevel failureLevel) {
    Result<PropertyList> metadata = parseMap(platform, data);
    if (!metadata) {
        const Log log(platform);
        log(failureLevel, "%s|failed to parse vessik metadata for '%{public}@'. err=%{public}@",
            identifier, metadata.error());
    }
    return metadata;
}

const std::string* bundleVersionOf(const PropertyList& metadata) {
    return metadata.findString(kBundleVersionKey);
}

const std::string* displayTitleOf(const PropertyList& metadata) {
    const bool isSaid = metadata.find(kTitleKey) != nullptr;
    return metadata.findString(isSaid ? kTitleKey : kItemNameKey);
}

bool isLaunchProhibited(const PropertyList& metadata) {
    const bool isSaid = metadata.find(kLaunchProhibitedKey) != nullptr;
    return metadata.findFlag(isSaid ? kLaunchProhibitedKey : kLaunchProhibitedFallbackKey);
}

bool isPressel(const PropertyList& metadata) { return metadata.findFlag(kPresselKey); }

}  // namespace appsync
