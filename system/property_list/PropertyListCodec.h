#pragma once

#include "platform/PropertyListSerialization.h"

namespace appsync {

/// Property lists in both encodings. Has no state: one object may serve any number of threads.
///
/// What starts with "bplist" is read as binary, everything else as XML. Everything that can be read
/// can be written in the same encoding and reads back equal; a value that XML cannot carry is
/// refused there with the advice to write binary. Running out of memory is an error like any other.
class SystemPropertyLists final : public PropertyListSerialization {
  public:
    Result<PropertyList> parse(ByteView bytes) override;
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override;
};

}  // namespace appsync
