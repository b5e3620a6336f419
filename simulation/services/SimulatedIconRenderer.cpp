#include "simulation/services/SimulatedIconRenderer.h"

#include <string>
#include <utility>

#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {

constexpr std::string_view kIconRenderer = "IconRenderer";
constexpr std::string_view kDestinationService = "ImageDestination";

}  // namespace

/// Counts itself as long as it lives.
class SimulatedIconRenderer::Counted {
  public:
    explicit Counted(std::size_t& count) : count_(count) { ++count_; }
    ~Counted() { --count_; }
    Counted(const Counted&) = delete;
    Counted& operator=(const Counted&) = delete;

  private:
    std::size_t& count_;
};

class SimulatedIconRenderer::Bundle : public AppBundle {
  public:
    Bundle(std::size_t& count, std::string bundlePath)
        : path(std::move(bundlePath)), counted_(count) {}

    const std::string path;

  private:
    const Counted counted_;
};

class SimulatedIconRenderer::Image : public IconImage {
  public:
    Image(std::size_t& count, std::string bundlePath)
        : path(std::move(bundlePath)), counted_(count) {}

    const std::string path;

  private:
    const Counted counted_;
};

class SimulatedIconRenderer::Destination : public ImageDestination {
  public:
    Destination(SimulatedIconRenderer& renderer, std::size_t capacity, Bytes& buffer)
        : renderer_(renderer),
          capacity_(capacity),
          buffer_(buffer),
          counted_(renderer.liveObjects_) {}

    void addImage(const IconImage& image) override {
        const auto* simulated = dynamic_cast<const Image*>(&image);
        if (simulated == nullptr) throw SimulationFailure("the image is of another renderer");
        const RecordedCall call(renderer_.recorder_, kDestinationService, "addImage",
                                simulated->path);
        if (++added_ > capacity_) throw SimulationFailure("more images than were announced");
        const Bytes bytes = imageOf(simulated->path);
        pending_.insert(pending_.end(), bytes.begin(), bytes.end());
    }

    [[nodiscard]] bool finalize() override {
        RecordedCall call(renderer_.recorder_, kDestinationService, "finalize");
        if (added_ == 0 || renderer_.fails(IconStep::Finalize)) return call.result(false);
        buffer_.insert(buffer_.end(), pending_.begin(), pending_.end());
        return call.result(true);
    }

  private:
    SimulatedIconRenderer& renderer_;
    const std::size_t capacity_;
    Bytes& buffer_;
    std::size_t added_ = 0;
    Bytes pending_;
    const Counted counted_;
};

std::unique_ptr<AppBundle> SimulatedIconRenderer::openBundle(const FileURL& url) {
    RecordedCall call(recorder_, kIconRenderer, "openBundle", url);
    if (fails(IconStep::OpenBundle)) return call.result(std::unique_ptr<Bundle>(), "(null)");
    return call.result(std::make_unique<Bundle>(liveObjects_, url.path()), "a bundle");
}

std::unique_ptr<IconImage> SimulatedIconRenderer::homeScreenIcon(const AppBundle& bundle) {
    const auto* simulated = dynamic_cast<const Bundle*>(&bundle);
    if (simulated == nullptr) throw SimulationFailure("the bundle is of another renderer");
    RecordedCall call(recorder_, kIconRenderer, "homeScreenIcon", simulated->path);
    if (fails(IconStep::HomeScreenIcon)) return call.result(std::unique_ptr<Image>(), "(null)");
    return call.result(std::make_unique<Image>(liveObjects_, simulated->path), "an image");
}

std::unique_ptr<ImageDestination> SimulatedIconRenderer::createImageDestination(
    std::string_view typeIdentifier, std::size_t imageCount, Bytes& buffer) {
    RecordedCall call(recorder_, kIconRenderer, "createImageDestination", typeIdentifier,
                      imageCount);
    if (fails(IconStep::CreateImageDestination) || typeIdentifier != "public.png") {
        return call.result(std::unique_ptr<Destination>(), "(null)");
    }
    return call.result(std::make_unique<Destination>(*this, imageCount, buffer), "a destination");
}

Bytes SimulatedIconRenderer::imageOf(std::string_view bundlePath) {
    const std::string text = "icon of " + std::string(bundlePath);
    return {text.begin(), text.end()};
}

}  // namespace appsync
