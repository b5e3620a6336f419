#pragma once

#include "platform/Bytes.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

/// Writes a value as a binary property list, version 1.0 ("bplist00"): each distinct string once,
/// and numbers, offsets and references as narrow as they can be without loss. What reads back is
/// equal to what was written. Refused: the null marker, and a text that is not UTF-8.
[[nodiscard]] Result<Bytes> writeBinaryPropertyList(const PropertyList& value);

}  // namespace appsync
