#include "client/PropertyListFile.h"

#include <utility>

#include "platform/FileSystem.h"
#include "platform/Platform.h"

namespace appsync {

std::optional<PropertyList> readMapFile(const Platform& platform, const std::string& path) {
    const Result<Bytes> bytes = platform.files.readFile(path);
    if (!bytes) return std::nullopt;
    Result<PropertyList> value = platform.propertyLists.parse(*bytes);
    if (!value || !value->isMap()) return std::nullopt;
    return *std::move(value);
}

Status writePropertyListFile(const Platform& platform, const std::string& path,
                             const PropertyList& value, PropertyListFormat format) {
    const Result<Bytes> bytes = platform.propertyLists.serialize(value, format);
    if (!bytes) return bytes.error();
    return platform.files.writeFileAtomically(path, *bytes);
}

}  // namespace appsync
