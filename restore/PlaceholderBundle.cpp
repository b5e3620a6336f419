#include "restore/PlaceholderBundle.h"

#include "client/Log.h"
#include "platform/AppRegistry.h"
#include "platform/Platform.h"

namespace appsync {

namespace {

Status installDirectory(AppRegistry& registry, const std::string& directory,
                        const PropertyList& options) {
    const auto url = FileURL::fromPath(directory, true);
    if (!url) return ErrorRecord{std::string(kPosixErrorDomain), kPosixInvalidArgument, {}};
    return registry.installPlaceholderBundle(*url, options);
}

}  // namespace

void willCreatePlaceholder(const Log& log, const std::string& identifier,
                           const PropertyList& info) {
    log(Level::Default, "%s|creating placeholder for '%{public}@'. info.plist=%{public}@",
        identifier, info);
}

bool installPlaceholder(const Platform& platform, const std::string& directory,
                        const PropertyList& info, const PropertyList& options) {
    const bool installed = installDirectory(platform.registry, directory, options).ok();
    const Log log(platform);
    const std::string* title = info.findString(BundleDisplayNameKey);
    const std::string* identifier = info.findString(BundleIdentifierKey);
    const std::string* version = info.findString(BundleVersionKey);
    const PropertyList* isPressel = info.find(kPresselKey);
    if (installed) {
        log(Level::Default,
            "%s|Installed Placeholder app from path %{public}@: %{public}@ [%{public}@ "
            "%{public}@] [isPressel: %{public}@]",
            directory, title, identifier, version, isPressel);
    } else {
        log(Level::Error,
            "%s|Placeholder app install failed from path %{public}@: %{public}@ [%{public}@ "
            "%{public}@] [isPressel: %{public}@]",
            directory, title, identifier, version, isPressel);
    }
    return installed;
}

}  // namespace appsync
