#include "system/JsonLogFacility.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <ctime>
#include <utility>

#include "platform/LogRendering.h"
#include "system/file/PosixError.h"

namespace appsync {

namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";

/// The kinds of bytes that begin a character of UTF-8: how long it is, and which second bytes keep
/// it from being overlong, a surrogate, or beyond the last character.
struct Lead {
    unsigned char first;
    unsigned char last;
    std::size_t length;
    unsigned char secondMinimum;
    unsigned char secondMaximum;
};
constexpr std::array<Lead, 9> kLeads{{{0x00, 0x7F, 1, 0, 0},
                                      {0xC2, 0xDF, 2, 0x80, 0xBF},
                                      {0xE0, 0xE0, 3, 0xA0, 0xBF},
                                      {0xE1, 0xEC, 3, 0x80, 0xBF},
                                      {0xED, 0xED, 3, 0x80, 0x9F},
                                      {0xEE, 0xEF, 3, 0x80, 0xBF},
                                      {0xF0, 0xF0, 4, 0x90, 0xBF},
                                      {0xF1, 0xF3, 4, 0x80, 0xBF},
                                      {0xF4, 0xF4, 4, 0x80, 0x8F}}};

bool isBetween(char c, unsigned char minimum, unsigned char maximum) {
    const auto byte = static_cast<unsigned char>(c);
    return byte >= minimum && byte <= maximum;
}

bool matches(std::string_view text, const Lead& lead) {
    if (!isBetween(text[0], lead.first, lead.last) || text.size() < lead.length) return false;
    if (lead.length > 1 && !isBetween(text[1], lead.secondMinimum, lead.secondMaximum))
        return false;
    for (std::size_t i = 2; i < lead.length; ++i) {
        if (!isBetween(text[i], 0x80, 0xBF)) return false;
    }
    return true;
}

/// The length of the character that the text begins with; 0 when it begins with none.
std::size_t characterLength(std::string_view text) {
    for (const Lead& lead : kLeads) {
        if (matches(text, lead)) return lead.length;
    }
    return 0;
}

void appendEscaped(std::string& json, char c) {
    constexpr std::string_view digits = "0123456789abcdef";
    const auto byte = static_cast<unsigned char>(c);
    if (c == '"' || c == '\\') {
        json += '\\';
        json += c;
    } else if (c == '\n') {
        json += "\\n";
    } else if (c == '\t') {
        json += "\\t";
    } else if (byte < 0x20 || byte == 0x7F) {
        json += "\\u00";
        json += digits[byte >> 4U];
        json += digits[byte & 15U];
    } else {
        json += c;
    }
}

/// How many characters at the beginning stand in JSON as they are, one byte each.
std::size_t plainLength(std::string_view text) {
    const auto isPlain = [](char c) { return c >= ' ' && c < '\x7F' && c != '"' && c != '\\'; };
    return static_cast<std::size_t>(std::find_if_not(text.begin(), text.end(), isPlain) -
                                    text.begin());
}

void appendString(std::string& json, std::string_view text) {
    json += '"';
    while (true) {
        const std::size_t plain = plainLength(text);
        json += text.substr(0, plain);
        text.remove_prefix(plain);
        if (text.empty()) break;
        const std::size_t length = characterLength(text);
        if (length == 0) {
            json += kReplacement;
        } else if (length == 1) {
            appendEscaped(json, text.front());
        } else {
            json += text.substr(0, length);
        }
        text.remove_prefix(length == 0 ? 1 : length);
    }
    json += '"';
}

std::string isoTime(std::chrono::system_clock::time_point time) {
    const auto seconds = std::chrono::floor<std::chrono::seconds>(time);
    const auto micros =
        std::chrono::duration_cast<std::chrono::microseconds>(time - seconds).count();
    const std::time_t clock = std::chrono::system_clock::to_time_t(seconds);
    std::tm parts{};
    ::gmtime_r(&clock, &parts);
    std::array<char, 96> text{};
    std::snprintf(text.data(), text.size(), "%04d-%02d-%02dT%02d:%02d:%02d.%06ldZ",
                  parts.tm_year + 1900, parts.tm_mon + 1, parts.tm_mday, parts.tm_hour,
                  parts.tm_min, parts.tm_sec, static_cast<long>(micros));
    return text.data();
}

}  // namespace

std::string_view nameOf(LogLevel level) noexcept {
    switch (level) {
        case LogLevel::Default:
            return "default";
        case LogLevel::Info:
            return "info";
        case LogLevel::Debug:
            return "debug";
        case LogLevel::Error:
            return "error";
        case LogLevel::Fault:
            return "fault";
    }
    return "default";
}

std::string toJson(const LogLine& line) {
    std::string json = "{\"time\":\"" + isoTime(line.time) +
                       "\",\"category\":" + std::to_string(static_cast<int>(line.category)) +
                       ",\"level\":\"";
    json.append(nameOf(line.level)).append("\",\"message\":");
    appendString(json, line.message);
    json += ",\"format\":";
    appendString(json, line.format);
    json += '}';
    return json;
}

void JsonLogFacility::write(const LogMessage& message) noexcept {
    try {
        append(message);
    } catch (...) {
        const std::lock_guard guard(mutex_);
        drop(ENOMEM);
    }
}

void JsonLogFacility::append(const LogMessage& message) {
    const std::string text = renderLogMessage(message);
    const std::lock_guard guard(mutex_);
    // The time is taken where the order is settled, so that the times in a log never go back.
    const LogLine line{std::chrono::system_clock::now(), message.category, message.level, text,
                       message.format};
    const int error = tellLoss() ? file_.append(toJson(line)) : lastError_;
    if (error != 0) drop(error);
    tellListener(line);
}

void JsonLogFacility::tellListener(const LogLine& line) const {
    try {
        if (listener_) listener_(line);
    } catch (...) {
        // It broke its word: the plug-in is not to hear of that.
        return;
    }
}

// Whether the log tells of all that was dropped.
bool JsonLogFacility::tellLoss() {
    if (dropped_ == toldDropped_) return true;
    const std::string text = std::to_string(dropped_ - toldDropped_) +
                             " messages could not be written: " + posixReason(lastError_);
    const LogLine line{std::chrono::system_clock::now(), LogCategory::General, LogLevel::Error,
                       text, "%llu messages could not be written: %s"};
    if (const int error = file_.append(toJson(line)); error != 0) {
        lastError_ = error;
        return false;
    }
    toldDropped_ = dropped_;
    return true;
}

void JsonLogFacility::drop(int error) {
    ++dropped_;
    lastError_ = error;
}

std::unique_ptr<LogHandle> JsonLogFacility::makeHandle(std::string_view /*subsystem*/,
                                                       std::string_view /*category*/) {
    return std::make_unique<LogHandle>();
}

void JsonLogFacility::setListener(Listener listener) {
    const std::lock_guard guard(mutex_);
    listener_.swap(listener);
}

JsonLogFacility::Loss JsonLogFacility::loss() const {
    const std::lock_guard guard(mutex_);
    return {dropped_, lastError_ == 0 ? std::string() : posixReason(lastError_)};
}

}  // namespace appsync
