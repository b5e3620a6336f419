#pragma once

#include "platform/InstallerService.h"

namespace appsync {

/// No list of what was uninstalled on the device: it is always empty. `installedAssets` then tells
/// the host only of applications that the state of the last sync names and that have gone.
class NoUninstalledList final : public InstallerService {
  public:
    [[nodiscard]] std::optional<PropertyList> lookupUninstalled() override {
        return PropertyList::map();
    }
    [[nodiscard]] bool clearUninstalled(std::span<const std::string> /*identifiers*/) override {
        return true;
    }
};

}  // namespace appsync
