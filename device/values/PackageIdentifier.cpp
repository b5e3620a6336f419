#include "device/values/PackageIdentifier.h"

#include "device/values/DeviceError.h"
#include "device/values/PackageText.h"

namespace appsync {

namespace {

constexpr std::string_view kArchiveSuffix = ".zip";
// No identifier ends so.
constexpr std::string_view kReplacedSuffix = "~zip";
constexpr std::size_t kLongestFileName = 255;

}  // namespace

Status requireLegalIdentifier(const std::string& identifier) {
    if (isLegalIdentifier(identifier)) return {};
    return registryError(RegistryErrorCode::IllegalIdentifier,
                         quotedName(identifier) + " is not the identifier of an application: " +
                             std::string(kIdentifierRule));
}

std::string archiveNameOf(const std::string& identifier) {
    if (identifier.size() + kArchiveSuffix.size() <= kLongestFileName) {
        return identifier + std::string(kArchiveSuffix);
    }
    if (!identifier.ends_with(kArchiveSuffix)) return identifier;
    return identifier.substr(0, identifier.size() - kArchiveSuffix.size()) +
           std::string(kReplacedSuffix);
}

std::optional<std::string> identifierOfArchive(std::string_view name) {
    std::string identifier(name);
    if (name.ends_with(kArchiveSuffix)) {
        identifier.resize(name.size() - kArchiveSuffix.size());
    } else if (name.ends_with(kReplacedSuffix)) {
        identifier.replace(name.size() - kReplacedSuffix.size(), kReplacedSuffix.size(),
                           kArchiveSuffix);
    }
    if (!isLegalIdentifier(identifier) || archiveNameOf(identifier) != name) return std::nullopt;
    return identifier;
}

}  // namespace appsync
