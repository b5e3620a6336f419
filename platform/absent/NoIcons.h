#pragma once

#include "platform/IconRenderer.h"

namespace appsync {

/// No icon renderer: no bundle can be opened. The client says so in the log for each application,
/// and each asset's icon is the artwork that the host sent along. Installs are as ever.
class NoIcons final : public IconRenderer {
  public:
    [[nodiscard]] std::unique_ptr<AppBundle> openBundle(const FileURL& /*url*/) override {
        return nullptr;
    }
    [[nodiscard]] std::unique_ptr<IconImage> homeScreenIcon(const AppBundle& /*bundle*/) override {
        return nullptr;
    }
    [[nodiscard]] std::unique_ptr<ImageDestination> createImageDestination(
        std::string_view /*typeIdentifier*/, std::size_t /*imageCount*/,
        Bytes& /*buffer*/) override {
        return nullptr;
    }
};

}  // namespace appsync
