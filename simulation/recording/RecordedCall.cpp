#include "simulation/recording/RecordedCall.h"

#include <array>
#include <cstdio>

#include "platform/InstallCoordinator.h"
#include "platform/LogRendering.h"
#include "platform/SyncAsset.h"

namespace appsync {

std::string callText(double value) {
    std::array<char, 32> text{};
    std::snprintf(text.data(), text.size(), "%g", value);
    return text.data();
}

std::string callText(ByteView value) { return "<" + std::to_string(value.size()) + " bytes>"; }
std::string callText(const Bytes& value) { return callText(ByteView(value)); }
std::string callText(const PropertyList& value) { return describe(value); }
std::string callText(const ErrorRecord& value) { return describe(value); }
std::string callText(const FileURL& value) { return value.path(); }

std::string callText(const ItemAttributes& value) {
    return value.isDirectory ? "directory" : std::to_string(value.size) + " bytes";
}

std::string callText(const FileAttributes& value) {
    return value.owner.value_or("(null)") + ":" + value.group.value_or("(null)");
}

std::string callText(const AppProxy& value) {
    return value.applicationIdentifier + (value.state.placeholder ? " (placeholder)" : "");
}

std::string callText(const std::vector<AppProxy>& value) {
    std::string text = "[";
    for (const AppProxy& proxy : value) {
        if (text.size() > 1) text += ", ";
        text += callText(proxy);
    }
    return text + "]";
}

std::string callText(const SyncAsset& value) {
    return value.identifier + ", " + value.dataclass +
           (value.isDownload ? ", download" : ", upload") +
           (value.prettyName ? ", named " + *value.prettyName : "");
}

std::string callText(const StoreMetadata& value) { return callText(value.metadata); }

std::string callText(const InstallOptions& value) {
    return callText(value.storeMetadata) + ", type " + callText(value.installType) + ", target " +
           callText(value.installTargetType);
}

std::string callText(const PlaceholderAttributes& value) {
    return callText(value.info) +
           (value.launchProhibited ? ", launch prohibited, version " : ", version ") +
           callText(value.bundleVersion);
}

std::string callText(const Status& value) { return value ? "ok" : callText(value.error()); }

std::string RecordedCall::joined(const std::vector<std::string>& texts) {
    std::string result;
    for (const std::string& text : texts) {
        if (&text != &texts.front()) result += ", ";
        result += text;
    }
    return result;
}

}  // namespace appsync
