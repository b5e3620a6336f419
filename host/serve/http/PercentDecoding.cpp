#include "host/serve/http/PercentDecoding.h"

#include <algorithm>
#include <cctype>
#include <charconv>
#include <cstddef>
#include <system_error>
#include <utility>

namespace appsync {
namespace {

std::optional<char> escapedCharacter(std::string_view digits) {
    unsigned value = 0;
    const auto [end, error] =
        std::from_chars(digits.data(), digits.data() + digits.size(), value, 16);
    if (digits.size() != 2 || error != std::errc() || end != digits.data() + 2) return std::nullopt;
    return static_cast<char>(value);
}

std::optional<std::string> percentDecoded(std::string_view text) {
    std::string decoded;
    decoded.reserve(text.size());
    for (std::size_t at = 0; at < text.size(); ++at) {
        if (text[at] != '%') {
            decoded.push_back(text[at]);
            continue;
        }
        const std::optional<char> character = escapedCharacter(text.substr(at + 1, 2));
        if (!character) return std::nullopt;
        decoded.push_back(*character);
        at += 2;
    }
    return decoded;
}

bool isPlainPiece(std::string_view piece) {
    const bool isName = !piece.empty() && piece != "." && piece != "..";
    return isName && std::none_of(piece.begin(), piece.end(), [](char each) {
               return each == '/' || std::iscntrl(static_cast<unsigned char>(each)) != 0;
           });
}

}  // namespace

std::optional<std::vector<std::string>> decodedPieces(std::string_view path) {
    if (!path.starts_with('/')) return std::nullopt;
    path.remove_prefix(1);
    std::vector<std::string> pieces;
    while (!path.empty()) {
        const std::size_t end = std::min(path.find('/'), path.size());
        std::optional<std::string> piece = percentDecoded(path.substr(0, end));
        if (!piece || !isPlainPiece(*piece)) return std::nullopt;
        pieces.push_back(*std::move(piece));
        if (end == path.size()) break;
        path.remove_prefix(end + 1);
        if (path.empty()) return std::nullopt;  // a slash at the end
    }
    return pieces;
}

std::string percentEncoded(std::string_view text) {
    constexpr std::string_view kDigits = "0123456789ABCDEF";
    constexpr std::string_view kPlain = "-._~";
    std::string encoded;
    encoded.reserve(text.size());
    for (const char each : text) {
        const auto byte = static_cast<unsigned char>(each);
        const bool isPlain = byte < 0x80 && std::isalnum(byte) != 0;
        if (isPlain || kPlain.find(each) != std::string_view::npos) {
            encoded.push_back(each);
            continue;
        }
        encoded.push_back('%');
        encoded.push_back(kDigits[byte >> 4U]);
        encoded.push_back(kDigits[byte & 15U]);
    }
    return encoded;
}

}  // namespace appsync
