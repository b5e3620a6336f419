#include "system/property_list/PropertyListErrors.h"

#include <algorithm>

namespace appsync {

namespace {

struct Place {
    std::size_t line = 1;
    std::size_t column = 1;
};

bool endsLine(ByteView text, std::size_t i) {
    if (text[i] == '\n') return true;
    return text[i] == '\r' && (i + 1 == text.size() || text[i + 1] != '\n');
}

bool continuesCharacter(std::uint8_t byte) { return (byte & 0xC0U) == 0x80; }

bool beginsWithMark(ByteView text) {
    return text.size() >= 3 && text[0] == 0xEF && text[1] == 0xBB && text[2] == 0xBF;
}

Place placeOf(ByteView text, std::size_t offset) {
    Place place;
    for (std::size_t i = beginsWithMark(text) ? 3 : 0; i < std::min(offset, text.size()); ++i) {
        if (endsLine(text, i)) {
            place = {place.line + 1, 1};
        } else if (!continuesCharacter(text[i])) {
            ++place.column;
        }
    }
    return place;
}

ErrorRecord makeError(PropertyListErrorCode code, std::string_view description) {
    return ErrorRecord::make(kPropertyListErrorDomain, static_cast<std::int64_t>(code),
                             description);
}

/// A key as part of a path, readable whatever bytes it holds.
std::string quoted(std::string_view key) {
    constexpr std::string_view digits = "0123456789abcdef";
    std::string result = "[\"";
    for (const char c : key) {
        const auto byte = static_cast<std::uint8_t>(c);
        if (byte >= 0x20 && byte < 0x7F && c != '"' && c != '\\') {
            result += c;
        } else {
            result += {'\\', 'x', digits[byte >> 4U], digits[byte & 15U]};
        }
    }
    return result + "\"]";
}

/// Puts the way from `value` to the part before `path`; false when the part is not in there.
bool prependPath(const PropertyList& value, const void* part, std::string& path) {
    if (&value == part) return true;
    const auto elements = value.elements();
    for (std::size_t i = 0; i < elements.size(); ++i) {
        if (!prependPath(elements[i], part, path)) continue;
        path.insert(0, "[" + std::to_string(i) + "]");
        return true;
    }
    for (const auto& [key, inner] : value.entries()) {
        if (&key != part && !prependPath(inner, part, path)) continue;
        path.insert(0, quoted(key));
        return true;
    }
    return false;
}

}  // namespace

ErrorRecord xmlReadError(ByteView document, std::size_t offset, std::string_view problem) {
    const Place place = placeOf(document, offset);
    ErrorRecord error =
        makeError(PropertyListErrorCode::Unreadable,
                  "XML property list, line " + std::to_string(place.line) + ", column " +
                      std::to_string(place.column) + ": " + std::string(problem));
    error.userInfo.set("line", place.line);
    error.userInfo.set("column", place.column);
    return error;
}

ErrorRecord binaryReadError(std::size_t offset, std::string_view problem) {
    ErrorRecord error = makeError(
        PropertyListErrorCode::Unreadable,
        "binary property list, offset " + std::to_string(offset) + ": " + std::string(problem));
    error.userInfo.set("offset", offset);
    return error;
}

ErrorRecord writeError(const PropertyList& root, const void* part, std::string_view problem) {
    std::string path;
    prependPath(root, part, path);
    const std::string where = path.empty() ? "the outermost value" : "the value at " + path;
    return makeError(PropertyListErrorCode::Unwritable, where + ": " + std::string(problem));
}

ErrorRecord outOfMemoryError(PropertyListErrorCode code) {
    return makeError(code, "not enough memory for this property list");
}

}  // namespace appsync
