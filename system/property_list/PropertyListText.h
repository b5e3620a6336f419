#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Bytes.h"

namespace appsync {

// The texts of both encodings: UTF-8 checked, converted from and to big-endian UTF-16, and held
// against what XML can carry. All of them are pure functions.

/// One character at the start of a text, and how many bytes it takes; no bytes: it is not UTF-8.
struct Utf8Character {
    char32_t code = 0;
    std::size_t size = 0;
};

/// The character that `text`, which is not empty, begins with. Refuses what is cut off, overlong, a
/// surrogate or beyond U+10FFFF.
[[nodiscard]] Utf8Character firstCharacter(std::string_view text) noexcept;

/// How many bytes at the start are ASCII.
[[nodiscard]] std::size_t asciiPrefix(std::string_view text) noexcept;

void appendUtf8(char32_t code, std::string& text);

/// Big-endian UTF-16 as UTF-8. Gives the offset of the first unpaired surrogate instead, if there
/// is one. `bytes` is of even size.
[[nodiscard]] std::optional<std::size_t> appendUtf16AsUtf8(ByteView bytes, std::string& text);

/// UTF-8 as big-endian UTF-16; nothing when it is not UTF-8.
[[nodiscard]] std::optional<Bytes> utf16FromUtf8(std::string_view text);

/// Whether an XML document may hold the character at all, be it as a reference.
[[nodiscard]] bool isXmlCharacter(char32_t code) noexcept;

/// The offset of the first byte where a text is not UTF-8 or holds a character that no XML document
/// may hold; nothing when all is well.
[[nodiscard]] std::optional<std::size_t> findNonXml(std::string_view text) noexcept;

/// "U+0041".
[[nodiscard]] std::string characterName(char32_t code);

}  // namespace appsync
