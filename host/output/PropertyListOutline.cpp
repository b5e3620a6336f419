#include "host/output/PropertyListOutline.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <string_view>

#include "host/console/Text.h"

namespace appsync {
namespace {

constexpr double kSecondsTo2001 = 978307200;
constexpr double kFarthestSecond = 2.6e11;  // some eight thousand years from 2001
constexpr std::size_t kShownBytes = 16;

std::string realText(double value) {
    std::array<char, 40> buffer{};
    std::snprintf(buffer.data(), buffer.size(), "%.17g", value);
    return buffer.data();
}

std::string hexText(const Bytes& bytes) {
    constexpr std::string_view kDigits = "0123456789abcdef";
    std::string text;
    for (const std::uint8_t byte : ByteView(bytes).first(std::min(bytes.size(), kShownBytes))) {
        text += kDigits[byte >> 4U];
        text += kDigits[byte & 15U];
    }
    return bytes.size() > kShownBytes ? text + "..." : text;
}

// What breaks a line, and what would look like it, stands as in most programming languages.
std::string inQuotes(std::string_view text) {
    constexpr std::string_view kEscaped = "\n\r\t\\\"";
    constexpr std::string_view kLetters = "nrt\\\"";
    std::string escaped = "\"";
    for (const char character : text) {
        const std::size_t found = kEscaped.find(character);
        if (found == std::string_view::npos) {
            escaped += character;
        } else {
            escaped.append({'\\', kLetters[found]});
        }
    }
    return printable(escaped + "\"");
}

std::string scalarText(const PropertyList& value) {
    switch (value.kind()) {
        case PropertyList::Kind::Boolean:
            return *value.asBoolean() ? "true" : "false";
        case PropertyList::Kind::Integer:
            return std::to_string(*value.asInteger());
        case PropertyList::Kind::Unsigned:
            return std::to_string(*value.asUnsigned());
        case PropertyList::Kind::Real:
            return realText(*value.asReal());
        case PropertyList::Kind::Date:
            return "date " + dateText(*value.asDate());
        case PropertyList::Kind::Data:
            return "data of " + formatBytes(value.asData()->size()) + " <" +
                   hexText(*value.asData()) + ">";
        case PropertyList::Kind::String:
            return inQuotes(*value.asString());
        default:
            return "null";
    }
}

void addOutline(const PropertyList& value, std::size_t depth, std::string& text) {
    const std::string indent(2 * depth, ' ');
    if (value.isMap()) {
        text += "map of " + std::to_string(value.size()) + "\n";
        for (const PropertyList::Entry& entry : value.entries()) {
            text += indent + "  " + printable(entry.key) + ": ";
            addOutline(entry.value, depth + 1, text);
        }
    } else if (value.isArray()) {
        text += "list of " + std::to_string(value.size()) + "\n";
        for (const PropertyList& element : value.elements()) {
            text += indent + "  - ";
            addOutline(element, depth + 1, text);
        }
    } else {
        text += scalarText(value) + "\n";
    }
}

}  // namespace

std::string propertyListOutline(const PropertyList& value) {
    std::string text;
    addOutline(value, 0, text);
    return text;
}

std::string dateText(const PropertyList::Date& date) {
    if (!(std::abs(date.secondsSince2001) < kFarthestSecond)) {
        return realText(date.secondsSince2001) + " s since 2001";
    }
    const auto seconds =
        static_cast<std::time_t>(std::floor(date.secondsSince2001 + kSecondsTo2001));
    std::tm parts{};
    gmtime_r(&seconds, &parts);
    std::array<char, 64> buffer{};
    const std::size_t length =
        std::strftime(buffer.data(), buffer.size(), "-%m-%dT%H:%M:%SZ", &parts);
    std::string year = std::to_string(parts.tm_year + 1900);
    if (parts.tm_year + 1900 >= 0 && year.size() < 4) year.insert(0, 4 - year.size(), '0');
    return year.append(buffer.data(), length);
}

std::string base64Text(ByteView bytes) {
    static constexpr std::string_view kDigits =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string text;
    text.reserve((bytes.size() + 2) / 3 * 4);
    for (std::size_t start = 0; start < bytes.size(); start += 3) {
        const std::size_t count = std::min<std::size_t>(3, bytes.size() - start);
        unsigned group = 0;
        for (std::size_t index = 0; index < 3; ++index) {
            group = group << 8U | (index < count ? bytes[start + index] : 0U);
        }
        for (std::size_t digit = 0; digit < 4; ++digit) {
            text += digit <= count ? kDigits[group >> (18 - 6 * digit) & 63U] : '=';
        }
    }
    return text;
}

}  // namespace appsync
