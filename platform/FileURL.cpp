#include "platform/FileURL.h"

#include <utility>

namespace appsync {

namespace {

bool standsAsItIs(char c) {
    const bool letter = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
    const bool digit = c >= '0' && c <= '9';
    return letter || digit ||
           std::string_view("-._~/!$&'()*+,=:@").find(c) != std::string_view::npos;
}

}  // namespace

FileURL::FileURL(std::string path, bool isDirectory)
    : path_(std::move(path)), isDirectory_(isDirectory) {}

std::optional<FileURL> FileURL::fromPath(std::string_view path, bool isDirectory) {
    if (path.empty() || path.find('\0') != std::string_view::npos) return std::nullopt;
    return FileURL(std::string(path), isDirectory);
}

std::string FileURL::text() const {
    constexpr std::string_view digits = "0123456789ABCDEF";
    std::string result = "file://";
    for (const char c : path_) {
        if (standsAsItIs(c)) {
            result += c;
            continue;
        }
        const auto byte = static_cast<unsigned char>(c);
        result += '%';
        result += digits[byte >> 4U];
        result += digits[byte & 15U];
    }
    if (isDirectory_ && result.back() != '/') result += '/';
    return result;
}

}  // namespace appsync
