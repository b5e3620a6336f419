#include "client/PropertyListFile.h"

#include <cstdint>
#include <utility>

#include "client/Log.h"
#include "platform/FileSystem.h"
#include "platform/Platform.h"

namespace appsync {

namespace {

/// The code, in `kPropertyListErrorDomain`, of a property list that is not what it should be.
constexpr std::int64_t kUnexpectedKind = 1;

}  // namespace

Result<PropertyList> parseMap(const Platform& platform, ByteView bytes) {
    Result<PropertyList> value = platform.propertyLists.parse(bytes);
    if (!value || value->isMap()) return value;
    return ErrorRecord::make(kPropertyListErrorDomain, kUnexpectedKind,
                             "the top level is not a map");
}

std::optional<PropertyList> readMapFile(const Platform& platform, const std::string& path) {
    const Result<Bytes> bytes = platform.files.readFile(path);
    if (!bytes) return std::nullopt;
    Result<PropertyList> map = parseMap(platform, *bytes);
    if (!map) return std::nullopt;
    return *std::move(map);
}

std::optional<PropertyList> readListFile(const Platform& platform, std::string_view path,
                                         bool (PropertyList::*isExpected)() const noexcept,
                                         const ListFileMessages& messages, ErrorOut error) {
    const Result<Bytes> bytes = platform.files.readFile(std::string(path));
    if (!bytes && error != nullptr) *error = bytes.error();
    if (!bytes || bytes->empty()) return std::nullopt;
    return parseListFile(platform, *bytes, isExpected, messages, error);
}

std::optional<PropertyList> parseListFile(const Platform& platform, ByteView bytes,
                                          bool (PropertyList::*isExpected)() const noexcept,
                                          const ListFileMessages& messages, ErrorOut error) {
    const Log log(platform);
    Result<PropertyList> list = platform.propertyLists.parse(bytes);
    if (!list) {
        if (error != nullptr) *error = list.error();
        log(Level::Error, messages.damaged);
        return std::nullopt;
    }
    if (!((*list).*isExpected)()) {
        log(Level::Error, messages.unexpected);
        return std::nullopt;
    }
    return *std::move(list);
}

Status writePropertyListFile(const Platform& platform, const std::string& path,
                             const PropertyList& value, PropertyListFormat format) {
    Result<Bytes> bytes = platform.propertyLists.serialize(value, format);
    // XML has no words for some characters of a text.
    if (!bytes && format == PropertyListFormat::Xml) {
        bytes = platform.propertyLists.serialize(value, PropertyListFormat::Binary);
    }
    if (!bytes) return bytes.error();
    return platform.files.writeFileAtomically(path, *bytes);
}

}  // namespace appsync
