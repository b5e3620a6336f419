#pragma once

#include <algorithm>
#include <cstddef>
#include <string_view>

namespace appsync {

/// The longest identifier of an application, in bytes.
inline constexpr std::size_t kMaximumIdentifierLength = 255;

/// Whether a device accepts the text as the identifier of an application: 1 to 255 bytes of
/// letters, digits, '.', '-' and '_', and neither "." nor "..". Such a text is safe as the name of
/// a file.
[[nodiscard]] constexpr bool isLegalIdentifier(std::string_view text) noexcept {
    if (text.empty() || text.size() > kMaximumIdentifierLength) return false;
    if (text == "." || text == "..") return false;
    return std::all_of(text.begin(), text.end(), [](char character) {
        return (character >= 'a' && character <= 'z') || (character >= 'A' && character <= 'Z') ||
               (character >= '0' && character <= '9') || character == '.' || character == '-' ||
               character == '_';
    });
}

}  // namespace appsync
