#pragma once

#include <cstdlib>

#include "system/PropertyListCodec.h"

namespace appsync {

/// Stops the run when something that was promised of a value that was read does not hold.
inline void require(bool holds) {
    if (!holds) std::abort();
}

/// What was read must be written and read back equal: in binary always, in XML if XML can carry it.
inline void requireRoundTrip(const PropertyList& value) {
    SystemPropertyLists codec;
    const auto binary = codec.serialize(value, PropertyListFormat::Binary);
    require(binary.ok());
    const auto fromBinary = codec.parse(*binary);
    require(fromBinary.ok() && *fromBinary == value);

    const auto xml = codec.serialize(value, PropertyListFormat::Xml);
    if (!xml) return;
    const auto fromXml = codec.parse(*xml);
    require(fromXml.ok() && *fromXml == value);
}

}  // namespace appsync
