#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "client/LogFormat.h"
#include "platform/Bytes.h"
#include "platform/PropertyList.h"
#include "platform/PropertyListSerialization.h"
#include "platform/Result.h"

namespace appsync {

struct Platform;

/// The map that the bytes hold, either encoding. The reader's error, or one that says that they
/// hold something else.
[[nodiscard]] Result<PropertyList> parseMap(const Platform& platform, ByteView bytes);

/// What is logged of a list file that cannot be parsed, and of one that holds something else.
struct ListFileMessages {
    LogFormat<true> damaged;
    LogFormat<true> unexpected;
};
/// The value in a file of the plug-in's own. Nothing when the file is missing or empty (not
/// logged), damaged or not what is expected (logged). `error` gets the error of reading or parsing.
[[nodiscard]] std::optional<PropertyList> readListFile(const Platform& platform,
                                                       std::string_view path,
                                                       bool (PropertyList::*isExpected)()
                                                           const noexcept,
                                                       const ListFileMessages& messages,
                                                       ErrorOut error);

/// The same of bytes that were read already and are not empty.
[[nodiscard]] std::optional<PropertyList> parseListFile(const Platform& platform, ByteView bytes,
                                                        bool (PropertyList::*isExpected)()
                                                            const noexcept,
                                                        const ListFileMessages& messages,
                                                        ErrorOut error);

/// The map in a property-list file, either encoding. Nothing when the file is missing, cannot be
/// read or parsed, or holds something else.
[[nodiscard]] std::optional<PropertyList> readMapFile(const Platform& platform,
                                                      const std::string& path);

/// Writes a property list atomically; what XML has no words for, in the binary encoding. The error
/// of whichever failed, the encoder or the file system; nothing is written then.
Status writePropertyListFile(const Platform& platform, const std::string& path,
                             const PropertyList& value, PropertyListFormat format);

}  // namespace appsync
