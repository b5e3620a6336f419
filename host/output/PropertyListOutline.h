#pragma once

#include <string>

#include "platform/Bytes.h"
#include "platform/PropertyList.h"

namespace appsync {

/// A property list for people: an outline with one value a line, each with its kind where that is
/// not plain. Ends with a line end.
[[nodiscard]] std::string propertyListOutline(const PropertyList& value);

/// ISO 8601, UTC; seconds since 2001 for what no calendar holds.
[[nodiscard]] std::string dateText(const PropertyList::Date& date);

[[nodiscard]] std::string base64Text(ByteView bytes);

}  // namespace appsync
