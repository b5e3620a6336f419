#include "system/file/PosixError.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <cstring>

namespace appsync {

namespace {

constexpr std::size_t kLongestShown = 1024;

void appendReadable(std::string& text, char c) {
    constexpr std::string_view digits = "0123456789abcdef";
    const auto byte = static_cast<unsigned char>(c);
    if (byte >= 0x20 && byte != 0x7f) {
        text += c;
        return;
    }
    text += "\\x";
    text += digits[byte >> 4U];
    text += digits[byte & 15U];
}

ErrorRecord failure(int code, std::string_view operation, const std::string& what,
                    std::string_view reason) {
    std::string sentence = "cannot ";
    sentence.append(operation).append(" ").append(what).append(": ").append(reason);
    return ErrorRecord::make(kPosixErrorDomain, code, sentence);
}

}  // namespace

std::string posixReason(int code) {
    if (code == EMFILE) return "Too many open files (raise their limit with ulimit -n)";
    if (const char* text = ::strerrordesc_np(code)) return text;
    return "unknown error " + std::to_string(code);
}

std::string displayPath(std::string_view path) {
    if (path.empty()) return "''";
    std::string text;
    const bool tooLong = path.size() > kLongestShown;
    for (const char c : tooLong ? path.substr(0, kLongestShown / 2) : path) appendReadable(text, c);
    if (!tooLong) return text;
    text += "[...]";
    for (const char c : path.substr(path.size() - kLongestShown / 2)) appendReadable(text, c);
    return text;
}

ErrorRecord posixError(int code, std::string_view operation, std::string_view path) {
    return failure(code, operation, displayPath(path), posixReason(code));
}

ErrorRecord posixError(int code, std::string_view operation, std::string_view path,
                       std::string_view reason) {
    return failure(code, operation, displayPath(path), reason);
}

ErrorRecord posixErrorBetween(int code, std::string_view operation, std::string_view from,
                              std::string_view to) {
    return failure(code, operation, displayPath(from) + " to " + displayPath(to),
                   posixReason(code));
}

bool isInTheWay(const ErrorRecord& error) {
    constexpr std::array<std::int64_t, 4> kCodes = {EEXIST, ENOTDIR, EISDIR, ELOOP};
    return error.domain == kPosixErrorDomain &&
           std::find(kCodes.begin(), kCodes.end(), error.code) != kCodes.end();
}

}  // namespace appsync
