#pragma once

// system/property_list: the two encodings of property lists. This header is all that others need:
// it looks at the bytes and hands them to PropertyListBinaryReader.h, or to
// PropertyListXmlReader.h, for which pugixml parses, or, where lists are plain,
// PropertyListPlainXmlReader.h, which is faster. PropertyListXmlValues.h and PropertyListText.h are
// what the XML side shares, PropertyListBinaryFormat.h what the binary side does (its reader, its
// writer, and PropertyListBinaryEdit.h, which changes a text in place), PropertyListErrors.h says
// where and why. Every byte may be foreign: what an input claims is bounded by what it could hold
// (fuzz/readers/). The value itself is platform/PropertyList.h. Includes platform/ and pugixml.

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
    /// Where the bytes are binary and hold the text already.
    bool replaceText(Bytes& bytes, std::size_t index, std::string_view key,
                     std::string_view text) override;
};

}  // namespace appsync
