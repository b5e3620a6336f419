#pragma once

#include <cstdint>
#include <string>

#include "device/install/InstallContext.h"
#include "platform/Result.h"

namespace appsync {

class FileURL;

/// Installs a package under an identifier that is legal, in place of what was installed, and takes
/// the placeholder away. The commit of one transaction is the last step: before it nothing has
/// changed, after it everything has, and it is on disk. Refused when a person has uninstalled the
/// identifier since the session began. `installType` counts where no placeholder
/// says how the application comes. Any thread; several installs share their syncs and commits.
Status installApplication(const InstallContext& context, const std::string& identifier,
                          const FileURL& package, std::uint64_t installType);

/// The same, for who keeps the failure himself: nothing is left of one but the error.
Status installApplicationWith(const InstallContext& context, const std::string& identifier,
                              const FileURL& package, std::uint64_t installType,
                              const AlsoCommitted& alsoCommitted);

}  // namespace appsync
