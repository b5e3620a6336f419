#pragma once

#include <cstddef>
#include <memory>
#include <string_view>

#include "platform/IconRenderer.h"

namespace appsync {

class PropertyListSerialization;
class RootDirectory;

/// Renders the home-screen icons of a device with cairo. Bundle paths and the icon files in them
/// are resolved inside the device's root and lead nowhere else; only regular files are read, with
/// the limits of IconDrawing.h. The arguments of the constructor outlive the renderer.
class CairoIconRenderer final : public IconRenderer {
  public:
    CairoIconRenderer(const RootDirectory& root, PropertyListSerialization& propertyLists);

    /// A bundle directory whose Info.plist is a map; null for everything else.
    [[nodiscard]] std::unique_ptr<AppBundle> openBundle(const FileURL& url) override;

    /// The image of the file that "BundleIconFile" names, "Icon.png" when the key is absent.
    [[nodiscard]] std::unique_ptr<IconImage> homeScreenIcon(const AppBundle& bundle) override;

    /// A destination for "public.png" and at least one image; PNG holds one image, so that of
    /// several that are added only the first is written. Null for other types and for a count of 0.
    [[nodiscard]] std::unique_ptr<ImageDestination> createImageDestination(
        std::string_view typeIdentifier, std::size_t imageCount, Bytes& buffer) override;

  private:
    const RootDirectory& root_;
    PropertyListSerialization& propertyLists_;
};

}  // namespace appsync
