#pragma once

#include <string_view>

#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

/// Whether the text can only be JSON: no encoding of a property list begins so.
[[nodiscard]] bool looksLikeJson(std::string_view text);

/// Reads a property list as `plist show --json` writes it: a map of the one key "data" with a
/// base64 text is data, one of "date" with a time in ISO 8601 (UTC) a date. Refuses what is no
/// JSON, names something twice or nests too deep, and says where.
[[nodiscard]] Result<PropertyList> propertyListOfJson(std::string_view text);

}  // namespace appsync
