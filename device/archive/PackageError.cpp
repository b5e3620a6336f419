#include "device/archive/PackageError.h"

#include "device/values/PackageText.h"

namespace appsync {

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

}  // namespace appsync
