#include "transfer/TransferItem.h"

#include "client/Paths.h"
#include "client/TodoList.h"
#include "platform/AppRegistry.h"

namespace appsync {

namespace {

constexpr std::string_view kPathKey = "Path";
constexpr std::string_view kContainerKey = "Container";
constexpr std::string_view kNameFromVessikKey = "NameFromVessik";
constexpr std::string_view kIsRestoreKey = "IsRestore";
constexpr std::string_view kIntentionallyDemotedKey = "intentional_demoted_app";
constexpr std::string_view kAutomaticallyDemotedKey = "auto_demoted_app";
constexpr std::string_view kSystemAppKey = "system_app";

std::optional<std::string> stringAt(const PropertyList& item, std::string_view key) {
    const std::string* text = item.findString(key);
    return text != nullptr ? std::optional(*text) : std::nullopt;
}

/// The flags of item maps are numbers.
int numberOf(bool flag) { return flag ? 1 : 0; }

void setIfPresent(PropertyList& item, std::string_view key, const PropertyList* value) {
    if (value != nullptr) item.set(key, *value);
}

}  // namespace

TransferItem TransferItem::fromItemMap(const PropertyList& item) {
    TransferItem result;
    result.identifier = stringAt(item, BundleIdentifierKey).value_or("");
    result.bundlePath = stringAt(item, kPathKey).value_or("");
    result.container = stringAt(item, kContainerKey).value_or("");
    result.version = stringAt(item, BundleVersionKey);
    result.nameFromVessik = stringAt(item, kNameFromVessikKey);
    result.isRestore = item.findFlag(kIsRestoreKey);
    result.isIntentionallyDemoted = item.findFlag(kIntentionallyDemotedKey);
    result.isAutomaticallyDemoted = item.findFlag(kAutomaticallyDemotedKey);
    result.isSystemApp = item.findFlag(kSystemAppKey);
    return result;
}

PropertyList itemMapFromTodoEntry(const std::string& identifier, const PropertyList& entry) {
    const std::string path = formatPath(kInDirectoryFormat, {kTodoDirectory, identifier});
    PropertyList item = PropertyList::map(
        {{BundleIdentifierKey, identifier}, {kPathKey, path}, {kContainerKey, path}});
    setIfPresent(item, BundleVersionKey, entry.find(kTodoVersionKey));
    setIfPresent(item, kNameFromVessikKey, entry.find(kTodoNameKey));
    return item;
}

PropertyList itemMapFromPlaceholder(const AppProxy& placeholder) {
    PropertyList item = PropertyList::map(
        {{BundleIdentifierKey, placeholder.applicationIdentifier},
         {kPathKey, placeholder.bundlePath},
         {kContainerKey, placeholder.bundleContainerPath},
         {kIsRestoreKey, numberOf(placeholder.installType == kInstallTypeRestore)},
         {kIntentionallyDemotedKey,
          numberOf(placeholder.installType == kInstallTypeIntentionalDowngrade)},
         {kAutomaticallyDemotedKey, numberOf(placeholder.installType == kInstallTypeDowngrade)},
         {kSystemAppKey, placeholder.applicationType == kApplicationTypeSystem}});
    if (placeholder.bundleVersion) item.set(BundleVersionKey, *placeholder.bundleVersion);
    return item;
}

}  // namespace appsync
