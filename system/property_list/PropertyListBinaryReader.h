#pragma once

#include "platform/Bytes.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

/// Reads a binary property list of version 0 ("bplist0").
///
/// Every number in it is checked before it is used. Objects may be shared, as far as the whole
/// stays within what an input of this size could hold (PropertyListBinaryFormat.h); an object
/// inside itself is refused, and so are equal keys in one map, since one entry would be lost, and
/// objects that no property-list value stands for (null, UID, set).
[[nodiscard]] Result<PropertyList> readBinaryPropertyList(ByteView bytes);

}  // namespace appsync
