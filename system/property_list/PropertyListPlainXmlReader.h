#pragma once

#include <optional>

#include "platform/Bytes.h"
#include "platform/PropertyList.h"

namespace appsync {

/// Reads an XML property list in the plain form that writers give it: no byte-order mark, the usual
/// declaration or none, no attributes but the version, and nothing but tags, white space and texts
/// in between. It goes straight from the bytes to the value, which no tree of nodes allows.
///
/// Nothing when the document is in any other form, or wrong: `readXmlPropertyList` reads those, and
/// says what is wrong. What this reader accepts, that one reads as the same value.
[[nodiscard]] std::optional<PropertyList> readPlainXmlPropertyList(ByteView document);

}  // namespace appsync
