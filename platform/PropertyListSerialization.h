#pragma once

#include <cstddef>
#include <string_view>

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

    /// Changes what `serialize` has written for an array of maps, so that it reads as the array in
    /// which the map at `index` has `text` under `key`, where it had something already: for who
    /// changes one text of a long list again and again. False, with the bytes as they were, when
    /// that cannot be had for less than writing all of it, which the caller does then; who
    /// implements this may leave it at that.
    virtual bool replaceText(Bytes& bytes, std::size_t index, std::string_view key,
                             std::string_view text) {
        (void)bytes, (void)index, (void)key, (void)text;
        return false;
    }
};

}  // namespace appsync
