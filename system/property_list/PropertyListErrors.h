#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "platform/Bytes.h"
#include "platform/Error.h"
#include "platform/PropertyList.h"

namespace appsync {

/// Codes of `kPropertyListErrorDomain`.
enum class PropertyListErrorCode { Unreadable = 1, Unwritable = 2 };

/// A refusal to read XML: `problem` at this byte of the document. The user information holds "line"
/// and "column" too; both count from 1, the column in characters.
[[nodiscard]] ErrorRecord xmlReadError(ByteView document, std::size_t offset,
                                       std::string_view problem);

/// A refusal to read binary: `problem` at this byte. The user information holds "offset" too.
[[nodiscard]] ErrorRecord binaryReadError(std::size_t offset, std::string_view problem);

/// A refusal to write the part of `root` that lies at the address `part`: a value or the key of an
/// entry inside. It is named as a path, `["apps"][3]`.
[[nodiscard]] ErrorRecord writeError(const PropertyList& root, const void* part,
                                     std::string_view problem);

/// Why neither encoding carries a date that is not finite.
inline constexpr std::string_view kNoTime = "the date is no point in time; remove it";

[[nodiscard]] ErrorRecord outOfMemoryError(PropertyListErrorCode code);

}  // namespace appsync
