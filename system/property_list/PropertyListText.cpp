#include "system/property_list/PropertyListText.h"

#include <array>
#include <cstring>

namespace appsync {

namespace {

constexpr char32_t kReplacementLimit = 0x110000;

bool isHighSurrogate(char32_t code) { return code >= 0xD800 && code <= 0xDBFF; }
bool isLowSurrogate(char32_t code) { return code >= 0xDC00 && code <= 0xDFFF; }

std::uint8_t byteAt(std::string_view text, std::size_t i) {
    return static_cast<std::uint8_t>(text[i]);
}

/// How many bytes a character with this first byte takes; 0: no character begins so.
std::size_t lengthFromFirst(std::uint8_t first) {
    if (first < 0x80) return 1;
    if (first < 0xC2) return 0;
    if (first < 0xE0) return 2;
    if (first < 0xF0) return 3;
    return first < 0xF5 ? 4 : 0;
}

bool isCharacter(char32_t code, std::size_t size) {
    constexpr std::array<char32_t, 5> smallest = {0, 0, 0x80, 0x800, 0x10000};
    return code >= smallest[size] && code < kReplacementLimit && !isHighSurrogate(code) &&
           !isLowSurrogate(code);
}

char32_t unitAt(ByteView bytes, std::size_t at) {
    return static_cast<char32_t>(bytes[at] << 8U | bytes[at + 1]);
}

void appendUnit(char32_t unit, Bytes& bytes) {
    bytes.push_back(static_cast<std::uint8_t>(unit >> 8U));
    bytes.push_back(static_cast<std::uint8_t>(unit & 0xFFU));
}

void appendUtf16(char32_t code, Bytes& bytes) {
    if (code < 0x10000) return appendUnit(code, bytes);
    appendUnit(0xD800 + ((code - 0x10000) >> 10U), bytes);
    appendUnit(0xDC00 + ((code - 0x10000) & 0x3FFU), bytes);
}

constexpr std::size_t kBlock = 32;

/// Whether all bytes of a block are ASCII that XML may hold. Written so that compilers vectorise
/// it.
bool isPlainBlock(const char* block) {
    std::uint8_t bad = 0;
    for (std::size_t i = 0; i < kBlock; ++i) {
        const auto byte = static_cast<std::uint8_t>(block[i]);
        const bool space = byte == '\t' || byte == '\n' || byte == '\r';
        bad |= static_cast<std::uint8_t>((byte >= 0x80) | ((byte < 0x20) & !space));
    }
    return bad == 0;
}

}  // namespace

Utf8Character firstCharacter(std::string_view text) noexcept {
    const std::uint8_t first = byteAt(text, 0);
    const std::size_t size = lengthFromFirst(first);
    if (size == 1) return {first, 1};
    if (size == 0 || size > text.size()) return {};
    char32_t code = first & (0x7FU >> size);
    for (std::size_t i = 1; i < size; ++i) {
        const std::uint8_t byte = byteAt(text, i);
        if ((byte & 0xC0U) != 0x80) return {};
        code = code << 6U | (byte & 0x3FU);
    }
    return isCharacter(code, size) ? Utf8Character{code, size} : Utf8Character{};
}

std::size_t asciiPrefix(std::string_view text) noexcept {
    std::size_t at = 0;
    for (; at + 8 <= text.size(); at += 8) {
        std::uint64_t word = 0;
        std::memcpy(&word, text.data() + at, 8);
        if ((word & 0x8080808080808080U) != 0) break;
    }
    while (at < text.size() && byteAt(text, at) < 0x80) ++at;
    return at;
}

void appendUtf8(char32_t code, std::string& text) {
    const auto tail = [code](unsigned shift) {
        return static_cast<char>(0x80U | (code >> shift & 0x3FU));
    };
    if (code < 0x80) {
        text += static_cast<char>(code);
    } else if (code < 0x800) {
        text += {static_cast<char>(0xC0U | code >> 6U), tail(0)};
    } else if (code < 0x10000) {
        text += {static_cast<char>(0xE0U | code >> 12U), tail(6), tail(0)};
    } else {
        text += {static_cast<char>(0xF0U | code >> 18U), tail(12), tail(6), tail(0)};
    }
}

std::optional<std::size_t> appendUtf16AsUtf8(ByteView bytes, std::string& text) {
    for (std::size_t at = 0; at < bytes.size(); at += 2) {
        char32_t code = unitAt(bytes, at);
        if (isLowSurrogate(code)) return at;
        if (isHighSurrogate(code)) {
            if (at + 2 == bytes.size() || !isLowSurrogate(unitAt(bytes, at + 2))) return at;
            at += 2;
            code = 0x10000 + ((code - 0xD800) << 10U) + (unitAt(bytes, at) - 0xDC00);
        }
        appendUtf8(code, text);
    }
    return std::nullopt;
}

std::optional<Bytes> utf16FromUtf8(std::string_view text) {
    Bytes result;
    result.reserve(text.size() * 2);
    while (!text.empty()) {
        const Utf8Character character = firstCharacter(text);
        if (character.size == 0) return std::nullopt;
        appendUtf16(character.code, result);
        text.remove_prefix(character.size);
    }
    return result;
}

bool isXmlCharacter(char32_t code) noexcept {
    if (code < 0x20) return code == '\t' || code == '\n' || code == '\r';
    const bool surrogate = isHighSurrogate(code) || isLowSurrogate(code);
    return !surrogate && code != 0xFFFE && code != 0xFFFF && code < kReplacementLimit;
}

std::optional<std::size_t> findNonXml(std::string_view text) noexcept {
    std::size_t at = 0;
    while (at < text.size()) {
        if (at + kBlock <= text.size() && isPlainBlock(text.data() + at)) {
            at += kBlock;
            continue;
        }
        for (const std::size_t end = at + kBlock; at < end && at < text.size();) {
            const Utf8Character character = firstCharacter(text.substr(at));
            if (character.size == 0 || !isXmlCharacter(character.code)) return at;
            at += character.size;
        }
    }
    return std::nullopt;
}

std::string characterName(char32_t code) {
    constexpr std::string_view digits = "0123456789ABCDEF";
    std::string result = "U+";
    for (unsigned shift = code < 0x10000 ? 16 : 24; shift != 0; shift -= 4) {
        result += digits[code >> (shift - 4) & 15U];
    }
    return result;
}

}  // namespace appsync
