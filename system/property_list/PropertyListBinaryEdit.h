#pragma once

#include <cstddef>
#include <string_view>

#include "platform/Bytes.h"

namespace appsync {

/// `PropertyListSerialization::replaceText` for bytes in the binary encoding. A text stands once in
/// the bytes and is referred to; so it is the reference that changes, nothing moves, and the text
/// must be there already.
[[nodiscard]] bool replaceBinaryText(Bytes& bytes, std::size_t index, std::string_view key,
                                     std::string_view text);

}  // namespace appsync
