#pragma once

#include <cstdint>
#include <string>

#include "platform/Error.h"

namespace appsync {

/// Codes of the errors that the plug-in makes, in `kSyncErrorDomain`.
enum class InstallError : std::int64_t {
    PreparationFailed = 1,  // a coordinator could not be set up for an install
    InstallCancelled = 2,   // an install was cancelled on the device while its package was coming
    RestoreFailed = 29,     // a piece of a restore came to nothing
    InstallFailed = 30,     // a piece of an install did, or the sync that was to bring it
};

/// An error of the plug-in's own; it carries no user information.
[[nodiscard]] inline ErrorRecord makeInstallError(InstallError code) {
    return {std::string(kSyncErrorDomain), static_cast<std::int64_t>(code), {}};
}

}  // namespace appsync
