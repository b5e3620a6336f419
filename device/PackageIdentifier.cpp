#include "device/PackageIdentifier.h"

#include <algorithm>

namespace appsync {

namespace {

bool isIdentifierCharacter(char character) noexcept {
    return (character >= 'a' && character <= 'z') || (character >= 'A' && character <= 'Z') ||
           (character >= '0' && character <= '9') || character == '.' || character == '-' ||
           character == '_';
}

}  // namespace

bool isLegalIdentifier(std::string_view text) noexcept {
    if (text.empty() || text.size() > kMaximumIdentifierLength) return false;
    if (text == "." || text == "..") return false;
    return std::all_of(text.begin(), text.end(), isIdentifierCharacter);
}

}  // namespace appsync
