#include "host/console/Text.h"

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

bool isContinuation(char byte) { return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U; }

std::size_t sequenceLength(unsigned char lead) {
    if (lead < 0x80) return 1;
    if (lead >= 0xC2 && lead < 0xE0) return 2;
    if (lead >= 0xE0 && lead < 0xF0) return 3;
    if (lead >= 0xF0 && lead < 0xF5) return 4;
    return 0;
}

// The code point of a sequence whose bytes fit together.
char32_t decoded(std::string_view sequence) {
    const auto lead = static_cast<unsigned char>(sequence.front());
    if (sequence.size() == 1) return lead;
    char32_t point = lead & (0xFFU >> (sequence.size() + 1));
    for (const char byte : sequence.substr(1)) {
        point = (point << 6U) | (static_cast<unsigned char>(byte) & 0x3FU);
    }
    return point;
}

struct Range {
    char32_t first;
    char32_t last;
};

// Control characters, and what reorders, hides or breaks a line of text.
constexpr std::array kUnprintable = {
    Range{0x00, 0x1F},     Range{0x7F, 0x9F},     Range{0x061C, 0x061C}, Range{0x200B, 0x200B},
    Range{0x200E, 0x200F}, Range{0x2028, 0x202E}, Range{0x2060, 0x206F}, Range{0xD800, 0xDFFF},
    Range{0xFEFF, 0xFEFF}, Range{0xFFF9, 0xFFFB}};

bool isPrintable(char32_t point, std::size_t length) {
    constexpr std::array<char32_t, 5> kSmallest = {0, 0, 0x80, 0x800, 0x10000};
    if (point < kSmallest.at(length) || point > 0x10FFFF) return false;
    return std::none_of(kUnprintable.begin(), kUnprintable.end(), [point](const Range& range) {
        return point >= range.first && point <= range.last;
    });
}

// The length of the well-formed character at the start of the text; 0 when there is none.
std::size_t characterLength(std::string_view text) {
    const std::size_t length = sequenceLength(static_cast<unsigned char>(text.front()));
    if (length == 0 || length > text.size()) return 0;
    const std::string_view tail = text.substr(1, length - 1);
    return std::all_of(tail.begin(), tail.end(), isContinuation) ? length : 0;
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
        const std::size_t length = characterLength(text);
        if (length != 0 && isPrintable(decoded(text.substr(0, length)), length)) {
            result += text.substr(0, length);
        } else {
            result += '?';
        }
        text.remove_prefix(std::max<std::size_t>(length, 1));
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
    return static_cast<std::size_t>(
        std::count_if(text.begin(), text.end(), [](char byte) { return !isContinuation(byte); }));
}

std::string fitted(std::string_view text, std::size_t width, std::string_view cutMark) {
    const std::size_t length = displayWidth(text);
    if (length <= width) return std::string(text).append(width - length, ' ');
    const std::string_view mark = beginOf(cutMark, width);
    return std::string(beginOf(text, width - displayWidth(mark))).append(mark);
}

std::string fittedAtFront(std::string_view text, std::size_t width, std::string_view cutMark) {
    if (displayWidth(text) <= width) return fitted(text, width, cutMark);
    const std::string_view mark = beginOf(cutMark, width);
    return std::string(mark).append(endOf(text, width - displayWidth(mark)));
}

std::string_view beginOf(std::string_view text, std::size_t width) {
    std::size_t end = 0;
    for (std::size_t characters = 0; end < text.size(); ++end) {
        if (!isContinuation(text[end]) && characters++ == width) break;
    }
    return text.substr(0, end);
}

std::string_view endOf(std::string_view text, std::size_t width) {
    std::size_t begin = text.size();
    for (std::size_t characters = 0; begin > 0 && characters < width;) {
        if (!isContinuation(text[--begin])) ++characters;
    }
    return text.substr(begin);
}

std::string wrapped(std::string line, std::size_t width, std::size_t indent) {
    if (width == 0) return line;
    if (indent >= width) indent = 0;
    std::string text;
    while (displayWidth(line) > width) {
        const std::size_t end = beginOf(line, width).size();
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
