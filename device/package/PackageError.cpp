#include "device/PackageError.h"

#include <cstddef>

#include "device/PackageText.h"

namespace appsync {

namespace {

constexpr std::size_t kLongestQuotedName = 200;

std::string escaped(unsigned char byte) {
    constexpr std::string_view kDigits = "0123456789abcdef";
    return {'\\', 'x', kDigits[byte >> 4U], kDigits[byte & 15U]};
}

}  // namespace

ErrorRecord packageError(PackageErrorCode code, std::string_view reason) {
    return ErrorRecord::make(kInstallerErrorDomain, static_cast<std::int64_t>(code), reason);
}

ErrorRecord duplicateEntry(std::string_view name) {
    return packageError(
        PackageErrorCode::DuplicateEntry,
        "entry " + quotedName(name) + " is in the package twice; make the package again");
}

bool isPackageError(const ErrorRecord& error, PackageErrorCode code) noexcept {
    return error.domain == kInstallerErrorDomain && error.code == static_cast<std::int64_t>(code);
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
