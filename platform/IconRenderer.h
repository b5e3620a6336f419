#pragma once

#include <cstddef>
#include <memory>
#include <string_view>

#include "platform/Bytes.h"
#include "platform/FileURL.h"

namespace appsync {

/// An open application bundle.
class AppBundle {
  public:
    virtual ~AppBundle() = default;
};

/// A rendered image.
class IconImage {
  public:
    virtual ~IconImage() = default;
};

/// Encodes images into a buffer that outlives it.
class ImageDestination {
  public:
    virtual ~ImageDestination() = default;
    virtual void addImage(const IconImage& image) = 0;
    /// Writes what was added into the buffer; false when that fails or nothing was added.
    [[nodiscard]] virtual bool finalize() = 0;
};

/// Renders home-screen icons. Callable on any thread; every result is the caller's, and null when
/// the step fails. Hostile images are refused with bounded memory and time.
class IconRenderer {
  public:
    virtual ~IconRenderer() = default;

    [[nodiscard]] virtual std::unique_ptr<AppBundle> openBundle(const FileURL& url) = 0;

    /// The icon in the size and style of this device.
    [[nodiscard]] virtual std::unique_ptr<IconImage> homeScreenIcon(const AppBundle& bundle) = 0;

    /// A destination for `imageCount` images of a type ("public.png") that writes into `buffer`.
    /// Null for a type that it does not know.
    [[nodiscard]] virtual std::unique_ptr<ImageDestination> createImageDestination(
        std::string_view typeIdentifier, std::size_t imageCount, Bytes& buffer) = 0;
};

}  // namespace appsync
