#include "system/property_list/PropertyListCodec.h"

#include <algorithm>
#include <new>
#include <string_view>
#include <utility>

#include "system/property_list/PropertyListBinaryEdit.h"
#include "system/property_list/PropertyListBinaryFormat.h"
#include "system/property_list/PropertyListBinaryReader.h"
#include "system/property_list/PropertyListBinaryWriter.h"
#include "system/property_list/PropertyListErrors.h"
#include "system/property_list/PropertyListPlainXmlReader.h"
#include "system/property_list/PropertyListXmlReader.h"
#include "system/property_list/PropertyListXmlWriter.h"

namespace appsync {

namespace {

/// How many bytes at the start are those of the binary encoding's magic.
std::size_t magicPrefix(ByteView bytes) {
    const auto differ =
        std::mismatch(kBinaryMagic.begin(), kBinaryMagic.end(), bytes.begin(), bytes.end());
    return static_cast<std::size_t>(differ.first - kBinaryMagic.begin());
}

Result<PropertyList> parseXml(ByteView bytes) {
    if (auto value = readPlainXmlPropertyList(bytes)) return std::move(*value);
    return readXmlPropertyList(bytes);
}

Result<PropertyList> parseEither(ByteView bytes) {
    constexpr std::size_t nameSize = std::string_view("bplist").size();
    const std::size_t prefix = magicPrefix(bytes);
    if (prefix < nameSize) return parseXml(bytes);
    if (prefix > nameSize) return readBinaryPropertyList(bytes);
    return binaryReadError(nameSize, "expected version 0 ('bplist00')");
}

}  // namespace

Result<PropertyList> SystemPropertyLists::parse(ByteView bytes) {
    try {
        return parseEither(bytes);
    } catch (const std::bad_alloc&) {
        return outOfMemoryError(PropertyListErrorCode::Unreadable);
    }
}

Result<Bytes> SystemPropertyLists::serialize(const PropertyList& value, PropertyListFormat format) {
    try {
        return format == PropertyListFormat::Binary ? writeBinaryPropertyList(value)
                                                    : writeXmlPropertyList(value);
    } catch (const std::bad_alloc&) {
        return outOfMemoryError(PropertyListErrorCode::Unwritable);
    }
}

bool SystemPropertyLists::replaceText(Bytes& bytes, std::size_t index, std::string_view key,
                                      std::string_view text) {
    return magicPrefix(bytes) == kBinaryMagic.size() && replaceBinaryText(bytes, index, key, text);
}

}  // namespace appsync
