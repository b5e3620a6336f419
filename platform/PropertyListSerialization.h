#pragma once

#include "platform/Bytes.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

/// The encodings of property lists.
enum class PropertyListFormat { Xml, Binary };

/// Reads and writes property lists. Callable on any thread.
class PropertyListSerialization {
  public:
    virtual ~PropertyListSerialization() = default;

    /// Reads either encoding, told apart by content. An error of `kPropertyListErrorDomain` says
    /// where (byte offset, or line and column) and what was expected.
    virtual Result<PropertyList> parse(ByteView bytes) = 0;

    /// Writes a value in one of the encodings (binary: version 1.0). Fails when the value holds a
    /// null marker, or a text that the encoding cannot carry.
    virtual Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) = 0;
};

}  // namespace appsync
