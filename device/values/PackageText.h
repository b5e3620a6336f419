#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace appsync {

/// The length in bytes of the UTF-8 sequence that the text begins with; 0 when it begins with none
/// (also for the empty text). Overlong forms, surrogates and what lies beyond U+10FFFF are none.
[[nodiscard]] std::size_t utf8SequenceLength(std::string_view text) noexcept;

[[nodiscard]] bool isValidUtf8(std::string_view text) noexcept;

/// The beginning of the text, at most `maximumBytes` of it and no sequence cut in two.
[[nodiscard]] std::string_view utf8Prefix(std::string_view text, std::size_t maximumBytes) noexcept;

/// Whether the byte is one of ASCII's control characters: below 0x20, or 0x7f.
[[nodiscard]] constexpr bool isControlCharacter(unsigned char byte) noexcept {
    return byte < 0x20 || byte == 0x7f;
}

[[nodiscard]] bool holdsControlCharacter(std::string_view text) noexcept;

/// A name from a package as people may read it: in quotes, control characters and bytes that are
/// not valid UTF-8 escaped (\x1b), and cut when it is very long.
[[nodiscard]] std::string quotedName(std::string_view name);

}  // namespace appsync
