#pragma once

#include <optional>

#include "platform/IconRenderer.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

/// The steps of rendering that can be made to fail.
enum class IconStep { OpenBundle, HomeScreenIcon, CreateImageDestination, Finalize };

/// Renders nothing: the bytes of the "image" are "icon of " and the path of the bundle, which need
/// not exist. Steps fail when the test says so.
class SimulatedIconRenderer : public IconRenderer {
  public:
    explicit SimulatedIconRenderer(Recorder& recorder) : recorder_(recorder) {}

    [[nodiscard]] std::unique_ptr<AppBundle> openBundle(const FileURL& url) override;
    [[nodiscard]] std::unique_ptr<IconImage> homeScreenIcon(const AppBundle& bundle) override;
    [[nodiscard]] std::unique_ptr<ImageDestination> createImageDestination(
        std::string_view typeIdentifier, std::size_t imageCount, Bytes& buffer) override;

    /// From now on this step fails; with nothing, none does.
    void failAt(std::optional<IconStep> step) { failing_ = step; }

    /// What rendering the icon of the bundle at a path leaves in the buffer.
    [[nodiscard]] static Bytes imageOf(std::string_view bundlePath);

    /// How many bundles, images and destinations exist; all belong to the plug-in.
    [[nodiscard]] std::size_t liveObjects() const { return liveObjects_; }

  private:
    class Counted;
    class Bundle;
    class Image;
    class Destination;

    [[nodiscard]] bool fails(IconStep step) const { return failing_ == step; }

    Recorder& recorder_;
    std::optional<IconStep> failing_;
    std::size_t liveObjects_ = 0;
};

}  // namespace appsync
