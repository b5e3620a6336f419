#include "restore/RestoredMetadata.h"

#include <string_view>

#include "restore/PlaceholderBundle.h"

namespace appsync {

namespace {

constexpr std::string_view kVersionKey = "bundleVersion";
constexpr std::string_view kTitleKey = "title";
constexpr std::string_view kItemNameKey = "itemName";
constexpr std::string_view kLaunchProhibitedFallbackKey = "launchProhibited";

}  // namespace

const std::string* bundleVersionOf(const PropertyList& metadata) {
    return metadata.findString(kVersionKey);
}

const std::string* displayTitleOf(const PropertyList& metadata) {
    const std::string* title = metadata.findString(kTitleKey);
    return title != nullptr ? title : metadata.findString(kItemNameKey);
}

bool isLaunchProhibited(const PropertyList& metadata) {
    const bool isSaid = metadata.find(kLaunchProhibitedKey) != nullptr;
    return metadata.findFlag(isSaid ? kLaunchProhibitedKey : kLaunchProhibitedFallbackKey);
}

bool isPressel(const PropertyList& metadata) { return metadata.findFlag(kPresselKey); }

}  // namespace appsync
