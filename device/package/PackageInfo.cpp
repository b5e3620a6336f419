#include "device/package/PackageInfo.h"

#include <string>
#include <utility>

#include "device/archive/PackageError.h"
#include "device/values/PackageIdentifier.h"
#include "device/values/PackageText.h"
#include "platform/AppRegistry.h"

namespace appsync {

namespace {

ErrorRecord illegal(PackageErrorCode code, std::string_view key, std::string_view reason) {
    return packageError(code, "Info.plist: the value of " + quotedName(key) + " " +
                                  std::string(reason) + "; correct it and make the package again");
}

/// The text at a key, or `otherwise` when the key is absent or the text empty.
Result<std::string> textAt(const PropertyList& info, std::string_view key,
                           std::string_view otherwise, const PackageLimits& limits) {
    const PropertyList* value = info.find(key);
    if (value == nullptr) return std::string(otherwise);
    const std::string* text = value->asString();
    if (text == nullptr) return illegal(PackageErrorCode::IllegalInfoValue, key, "is not a string");
    if (text->empty()) return std::string(otherwise);
    if (text->size() > limits.textBytes) {
        return illegal(PackageErrorCode::IllegalInfoValue, key, "is too long");
    }
    if (!isValidUtf8(*text) || holdsControlCharacter(*text)) {
        return illegal(PackageErrorCode::IllegalInfoValue, key,
                       "holds characters that no one sees");
    }
    return *text;
}

/// The same for what must name a file of the bundle.
Result<std::string> fileNameAt(const PropertyList& info, std::string_view key,
                               std::string_view otherwise, const PackageLimits& limits) {
    Result<std::string> name = textAt(info, key, otherwise, limits);
    if (!name) return name;
    const bool isPlain = *name != "." && *name != ".." &&
                         name->find_first_of("/\\") == std::string::npos &&
                         name->size() <= limits.componentBytes;
    if (isPlain) return name;
    return illegal(PackageErrorCode::IllegalInfoValue, key,
                   "is not the name of a file of the bundle");
}

Result<std::string> identifierIn(const PropertyList& info) {
    const std::string* identifier = info.findString(BundleIdentifierKey);
    if (identifier == nullptr) {
        return illegal(PackageErrorCode::IllegalIdentifier, BundleIdentifierKey,
                       "is missing or is not a string");
    }
    if (isLegalIdentifier(*identifier)) return *identifier;
    return illegal(
        PackageErrorCode::IllegalIdentifier, BundleIdentifierKey,
        "is " + quotedName(*identifier) + ", which is not " + std::string(kIdentifierRule));
}

}  // namespace

Result<PackageInfo> packageInfoFrom(PropertyList info, std::string_view bundleDirectoryName,
                                    const PackageLimits& limits) {
    if (!info.isMap()) {
        return packageError(PackageErrorCode::DamagedInfoPropertyList,
                            "Info.plist is not a map; correct it and make the package again");
    }
    const std::string_view stem = bundleDirectoryName.substr(0, bundleDirectoryName.rfind('.'));
    Result<std::string> identifier = identifierIn(info);
    if (!identifier) return identifier.error();
    Result<std::string> version = textAt(info, BundleVersionKey, "", limits);
    if (!version) return version.error();
    Result<std::string> displayName = textAt(info, BundleDisplayNameKey, stem, limits);
    if (!displayName) return displayName.error();
    Result<std::string> executable = fileNameAt(info, BundleExecutableKey, "", limits);
    if (!executable) return executable.error();
    Result<std::string> iconFile = fileNameAt(info, BundleIconFileKey, kUsualIconFile, limits);
    if (!iconFile) return iconFile.error();

    PackageInfo result;
    result.identifier = *std::move(identifier);
    result.version = *std::move(version);
    result.displayName = *std::move(displayName);
    result.executable = *std::move(executable);
    result.iconFile = *std::move(iconFile);
    result.bundleDirectoryName = bundleDirectoryName;
    result.info = std::move(info);
    return result;
}

}  // namespace appsync
