#pragma once

#include <optional>
#include <span>
#include <string>

#include "platform/PropertyList.h"

namespace appsync {

/// The installer's list of applications that were uninstalled on the device. Callable on any
/// thread. What the registry uninstalls for the plug-in is not on it.
class InstallerService {
  public:
    virtual ~InstallerService() = default;

    /// A map keyed by bundle identifier; nothing when the installer does not answer. What stands
    /// under a key is the installer's own: the plug-in reads the keys. The list outlives the
    /// process.
    [[nodiscard]] virtual std::optional<PropertyList> lookupUninstalled() = 0;

    /// Takes identifiers off the list; those that are not on it are passed over. False when it
    /// could not: the list is then as before.
    [[nodiscard]] virtual bool clearUninstalled(std::span<const std::string> identifiers) = 0;
};

}  // namespace appsync
