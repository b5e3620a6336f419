#include "host/console/Text.h"

#include <utf8proc.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <ctime>
#include <optional>

namespace appsync {
namespace {

std::string formatWith(const char* format, const std::tm& parts) {
    std::array<char, 64> buffer{};
    const std::size_t length = std::strftime(buffer.data(), buffer.size(), format, &parts);
    return {buffer.data(), length};
}

std::tm localParts(std::chrono::system_clock::time_point time) {
    const std::time_t seconds = std::chrono::system_clock::to_time_t(time);
    std::tm parts{};
    localtime_r(&seconds, &parts);
    return parts;
}

struct WrittenTime {
    std::chrono::system_clock::time_point time;
    std::string_view fraction;  // of its second: ".250", or empty
};

// "2026-01-31T12:00:00Z", with a fraction or without; nothing where the text is anything else.
std::optional<WrittenTime> parsedTime(std::string_view text) {
    constexpr std::string_view kPattern = "0000-00-00T00:00:00";
    if (text.size() <= kPattern.size() || !text.ends_with('Z')) return std::nullopt;
    text.remove_suffix(1);
    const auto isDigit = [](char c) { return c >= '0' && c <= '9'; };
    for (std::size_t index = 0; index < kPattern.size(); ++index) {
        const bool isRight =
            kPattern[index] == '0' ? isDigit(text[index]) : text[index] == kPattern[index];
        if (!isRight) return std::nullopt;
    }
    const std::string_view fraction = text.substr(kPattern.size());
    const bool isFraction =
        fraction.empty() || (fraction.size() > 1 && fraction.front() == '.' &&
                             std::all_of(fraction.begin() + 1, fraction.end(), isDigit));
    std::tm parts{};
    const std::string seconds(text.substr(0, kPattern.size()));
    if (!isFraction || ::strptime(seconds.c_str(), "%Y-%m-%dT%H:%M:%S", &parts) == nullptr) {
        return std::nullopt;
    }
    return WrittenTime{std::chrono::system_clock::from_time_t(::timegm(&parts)), fraction};
}

// A character at the start of a text.
struct Character {
    std::size_t length;  // in bytes
    std::optional<utf8proc_int32_t>
        point;  // nothing where the bytes are none: a single one is taken
};

Character firstOf(std::string_view text) {
    utf8proc_int32_t point = 0;
    const utf8proc_ssize_t length =
        utf8proc_iterate(reinterpret_cast<const utf8proc_uint8_t*>(text.data()),
                         static_cast<utf8proc_ssize_t>(text.size()), &point);
    if (length <= 0) return {1, std::nullopt};
    return {static_cast<std::size_t>(length), point};
}

// The columns that a terminal gives to it.
std::size_t columnsOf(const Character& character) {
    if (!character.point) return 1;
    return static_cast<std::size_t>(std::max(utf8proc_charwidth(*character.point), 0));
}

struct Range {
    utf8proc_int32_t first;
    utf8proc_int32_t last;
};

// Control characters, and what reorders, hides or breaks a line of text.
constexpr std::array kUnprintable = {
    Range{0x00, 0x1F},     Range{0x7F, 0x9F},     Range{0x061C, 0x061C},
    Range{0x200B, 0x200B}, Range{0x200E, 0x200F}, Range{0x2028, 0x202E},
    Range{0x2060, 0x206F}, Range{0xFEFF, 0xFEFF}, Range{0xFFF9, 0xFFFB}};

bool isPrintable(const Character& character) {
    return character.point &&
           std::none_of(kUnprintable.begin(), kUnprintable.end(), [&](const Range& range) {
               return *character.point >= range.first && *character.point <= range.last;
           });
}

// How much of the text is ASCII without control characters: nearly all of it, mostly.
std::size_t plainLength(std::string_view text) {
    std::size_t length = 0;
    while (length < text.size() && text[length] >= 0x20 && text[length] < 0x7F) ++length;
    return length;
}

}  // namespace

std::string formatBytes(std::uint64_t bytes) {
    if (bytes < 1024) return bytes == 1 ? "1 byte" : std::to_string(bytes) + " bytes";
    static constexpr std::array kUnits = {"KiB", "MiB", "GiB", "TiB", "PiB", "EiB"};
    double value = static_cast<double>(bytes) / 1024;
    std::size_t unit = 0;
    for (; value >= 1023.95 && unit + 1 < kUnits.size(); ++unit) value /= 1024;
    std::array<char, 32> buffer{};
    std::snprintf(buffer.data(), buffer.size(), "%.1f %s", value, kUnits.at(unit));
    return buffer.data();
}

std::string formatTime(std::chrono::system_clock::time_point time) {
    const std::time_t seconds = std::chrono::system_clock::to_time_t(time);
    std::tm parts{};
    gmtime_r(&seconds, &parts);
    return formatWith("%Y-%m-%dT%H:%M:%SZ", parts);
}

std::string formatLocalTime(std::chrono::system_clock::time_point time) {
    return formatWith("%Y-%m-%d %H:%M:%S %z", localParts(time));
}

std::string localTimeOf(std::string_view text) {
    const std::optional<WrittenTime> written = parsedTime(text);
    if (!written) return printable(text);
    const std::tm parts = localParts(written->time);
    return formatWith("%Y-%m-%d %H:%M:%S", parts) + std::string(written->fraction) +
           formatWith(" %z", parts);
}

std::string formatClock(std::chrono::system_clock::time_point time) {
    return formatWith("%H:%M:%S %z", localParts(time));
}

std::string printable(std::string_view text) {
    std::string result;
    result.reserve(text.size());
    while (!text.empty()) {
        const std::size_t plain = plainLength(text);
        result += text.substr(0, plain);
        text.remove_prefix(plain);
        if (text.empty()) break;
        const Character character = firstOf(text);
        result += isPrintable(character) ? text.substr(0, character.length) : "?";
        text.remove_prefix(character.length);
    }
    return result;
}

std::string formatDuration(std::chrono::seconds time) {
    constexpr std::int64_t kMinute = 60;
    const std::int64_t seconds = time.count() % kMinute;
    return std::to_string(time.count() / kMinute) + (seconds < 10 ? ":0" : ":") +
           std::to_string(seconds);
}

std::size_t displayWidth(std::string_view text) {
    std::size_t width = 0;
    while (!text.empty()) {
        const std::size_t plain = plainLength(text);
        width += plain;
        text.remove_prefix(plain);
        if (text.empty()) break;
        const Character character = firstOf(text);
        width += columnsOf(character);
        text.remove_prefix(character.length);
    }
    return width;
}

std::string fitted(std::string_view text, std::size_t width, std::string_view cutMark) {
    const std::size_t length = displayWidth(text);
    if (length <= width) return std::string(text).append(width - length, ' ');
    const std::string_view mark = beginOf(cutMark, width);
    return fitted(std::string(beginOf(text, width - displayWidth(mark))).append(mark), width);
}

std::string fittedAtFront(std::string_view text, std::size_t width, std::string_view cutMark) {
    if (displayWidth(text) <= width) return fitted(text, width, cutMark);
    const std::string_view mark = beginOf(cutMark, width);
    return fitted(std::string(mark).append(endOf(text, width - displayWidth(mark))), width);
}

std::string_view beginOf(std::string_view text, std::size_t width) {
    std::size_t end = 0;
    while (end < text.size()) {
        const Character character = firstOf(text.substr(end));
        const std::size_t columns = columnsOf(character);
        if (columns > width) break;
        width -= columns;
        end += character.length;
    }
    return text.substr(0, end);
}

std::string_view endOf(std::string_view text, std::size_t width) {
    std::size_t left = displayWidth(text);
    bool isCut = left > width;
    while (isCut && !text.empty()) {
        const Character character = firstOf(text);
        // An accent goes with the letter that it stands on.
        isCut = left > width || columnsOf(character) == 0;
        if (!isCut) break;
        left -= columnsOf(character);
        text.remove_prefix(character.length);
    }
    return text;
}

std::string wrapped(std::string line, std::size_t width, std::size_t indent) {
    if (width == 0) return line;
    if (indent >= width) indent = 0;
    std::string text;
    while (displayWidth(line) > width && firstOf(line).length < line.size()) {
        const std::size_t end = std::max(beginOf(line, width).size(), firstOf(line).length);
        const std::size_t blank = line.rfind(' ', end);
        const bool isBetweenWords = blank != std::string::npos && blank > indent;
        const std::size_t last = line.find_last_not_of(' ', isBetweenWords ? blank : end - 1);
        text.append(line, 0, last + 1).append("\n");
        line = std::string(indent, ' ') + line.substr(isBetweenWords ? blank + 1 : end);
    }
    return text + line;
}

std::string shellWord(std::string_view text) {
    constexpr std::string_view kPlain =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789_./+,:@%-";
    const std::string shown = printable(text);
    if (!shown.empty() && shown.find_first_not_of(kPlain) == std::string::npos) return shown;
    std::string quoted = "'";
    for (const char each : shown)
        quoted += each == '\'' ? std::string("'\\''") : std::string(1, each);
    return quoted + "'";
}

std::string counted(std::uint64_t number, std::string_view noun) {
    return std::to_string(number) + " " + std::string(noun) + (number == 1 ? "" : "s");
}

}  // namespace appsync
