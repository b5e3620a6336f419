#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/PropertyList.h"

namespace appsync {

/// The safe-identifier rule, for identifiers and for paths of received files: a string that
/// contains no "/..". It is the only rule that the plug-in itself applies to them.
[[nodiscard]] inline bool isSafeText(std::string_view text) {
    return text.find("/..") == std::string_view::npos;
}
/// The same for any value, and for none.
[[nodiscard]] inline bool isSafe(const PropertyList* value) {
    const std::string* text = value != nullptr ? value->asString() : nullptr;
    return text != nullptr && isSafeText(*text);
}
[[nodiscard]] inline bool isSafe(const std::optional<std::string>& text) {
    return text.has_value() && isSafeText(*text);
}

}  // namespace appsync
