#include "device/screen/IconDrawing.h"

#include "device/screen/IconCanvas.h"

namespace appsync {

namespace {

constexpr IconPlace kWholeIcon = {0, 0, kIconSize};

}  // namespace

Result<Bytes> renderIcon(ByteView png) {
    const Result<Surface> image = decodePng(png);
    if (!image) return image.error();
    const Result<Surface> icon = makeSurface(kIconSize, kIconSize);
    if (!icon) return icon.error();
    drawIcon(drawOn(icon->get()).get(), image->get(), kWholeIcon);
    return encodePng(icon->get());
}

Result<Bytes> renderDefaultIcon(const std::string& identifier, const std::string& name) {
    const Result<Surface> icon = makeSurface(kIconSize, kIconSize);
    if (!icon) return icon.error();
    drawLetterIcon(drawOn(icon->get()).get(), identifier, name, kWholeIcon);
    return encodePng(icon->get());
}

}  // namespace appsync
