#include "device/values/PackageText.h"

#include <algorithm>

namespace appsync {

namespace {

/// How long a sequence is by its first byte, and the range that its second byte must be in.
struct SequenceShape {
    std::size_t length = 0;
    unsigned char lowestSecond = 0x80;
    unsigned char highestSecond = 0xbf;
};

SequenceShape shapeOf(unsigned char first) noexcept {
    if (first < 0x80) return {.length = 1};
    if (first < 0xc2) return {};
    if (first < 0xe0) return {.length = 2};
    if (first == 0xe0) return {.length = 3, .lowestSecond = 0xa0};
    if (first == 0xed) return {.length = 3, .highestSecond = 0x9f};
    if (first < 0xf0) return {.length = 3};
    if (first == 0xf0) return {.length = 4, .lowestSecond = 0x90};
    if (first < 0xf4) return {.length = 4};
    if (first == 0xf4) return {.length = 4, .highestSecond = 0x8f};
    return {};
}

bool isContinuation(char character) noexcept {
    return (static_cast<unsigned char>(character) & 0xc0U) == 0x80U;
}

constexpr std::size_t kLongestQuotedName = 200;

std::string escaped(unsigned char byte) {
    constexpr std::string_view kDigits = "0123456789abcdef";
    return {'\\', 'x', kDigits[byte >> 4U], kDigits[byte & 15U]};
}

}  // namespace

std::size_t utf8SequenceLength(std::string_view text) noexcept {
    if (text.empty()) return 0;
    const SequenceShape shape = shapeOf(static_cast<unsigned char>(text[0]));
    if (shape.length < 2) return shape.length;
    if (text.size() < shape.length) return 0;
    const auto second = static_cast<unsigned char>(text[1]);
    if (second < shape.lowestSecond || second > shape.highestSecond) return 0;
    const std::string_view rest = text.substr(2, shape.length - 2);
    return std::all_of(rest.begin(), rest.end(), isContinuation) ? shape.length : 0;
}

bool isValidUtf8(std::string_view text) noexcept {
    while (!text.empty()) {
        const std::size_t length = utf8SequenceLength(text);
        if (length == 0) return false;
        text.remove_prefix(length);
    }
    return true;
}

std::string_view utf8Prefix(std::string_view text, std::size_t maximumBytes) noexcept {
    if (text.size() <= maximumBytes) return text;
    std::size_t end = maximumBytes;
    while (end > 0 && isContinuation(text[end])) --end;
    return text.substr(0, end);
}

bool holdsControlCharacter(std::string_view text) noexcept {
    return std::any_of(text.begin(), text.end(), [](char character) {
        return isControlCharacter(static_cast<unsigned char>(character));
    });
}

std::string quotedName(std::string_view name) {
    const std::string_view shown = utf8Prefix(name, kLongestQuotedName);
    std::string quoted = "'";
    for (std::size_t position = 0; position < shown.size();) {
        const std::size_t length = utf8SequenceLength(shown.substr(position));
        const auto byte = static_cast<unsigned char>(shown[position]);
        if (length == 0 || isControlCharacter(byte)) {
            quoted += escaped(byte);
            ++position;
        } else {
            quoted.append(shown.substr(position, length));
            position += length;
        }
    }
    return quoted + (shown.size() < name.size() ? "...'" : "'");
}

}  // namespace appsync
