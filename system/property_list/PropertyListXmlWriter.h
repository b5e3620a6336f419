#pragma once

#include "platform/Bytes.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

/// Writes a value as an XML property list, UTF-8, without a document type declaration. What reads
/// back is equal to what was written. Refused, because XML has no words for it: the null marker, a
/// text that is not UTF-8 or holds a control character other than tab and line ends, a date outside
/// the years 0001 to 9999. Fractions of a second are written as decimals ("...T00:00:00.25Z").
[[nodiscard]] Result<Bytes> writeXmlPropertyList(const PropertyList& value);

}  // namespace appsync
