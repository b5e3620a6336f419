#include "device/screen/CairoIconRenderer.h"

#include <optional>
#include <string>
#include <utility>

#include "device/package/PackageInfo.h"
#include "device/screen/IconDrawing.h"
#include "platform/AppRegistry.h"
#include "platform/PropertyList.h"
#include "platform/PropertyListSerialization.h"
#include "system/file/DescriptorIO.h"
#include "system/file/RootDirectory.h"

namespace appsync {

namespace {

constexpr std::string_view kPngType = "public.png";
constexpr std::uint64_t kMaximumInfoBytes = std::uint64_t{1} << 20;

class OpenBundle final : public AppBundle {
  public:
    OpenBundle(std::string path, std::string iconFile)
        : path_(std::move(path)), iconFile_(std::move(iconFile)) {}

    [[nodiscard]] std::string iconPath() const { return path_ + "/" + iconFile_; }

  private:
    std::string path_;
    std::string iconFile_;
};

class EncodedIcon final : public IconImage {
  public:
    explicit EncodedIcon(Bytes png) : png_(std::move(png)) {}
    [[nodiscard]] const Bytes& png() const noexcept { return png_; }

  private:
    Bytes png_;
};

class PngDestination final : public ImageDestination {
  public:
    explicit PngDestination(Bytes& buffer) : buffer_(buffer) {}

    void addImage(const IconImage& image) override {
        const auto* icon = dynamic_cast<const EncodedIcon*>(&image);
        if (icon != nullptr && !png_) png_ = icon->png();
    }

    bool finalize() override {
        if (!png_) return false;
        buffer_ = *std::exchange(png_, std::nullopt);
        return true;
    }

  private:
    Bytes& buffer_;
    std::optional<Bytes> png_;
};

/// A regular file inside the root that has at most that many bytes.
std::optional<Bytes> readSmallFile(const RootDirectory& root, const std::string& path,
                                   std::uint64_t maximumBytes) {
    const Result<RegularFile> file = root.openRegularFile(path);
    if (!file || file->size > maximumBytes) return std::nullopt;
    Bytes contents;
    if (readWhole(file->descriptor.get(), file->size, maximumBytes, contents) != 0) {
        return std::nullopt;
    }
    return contents;
}

bool isPlainFileName(std::string_view name) noexcept {
    return !name.empty() && name != "." && name != ".." &&
           name.find_first_of(std::string_view("/\0", 2)) == std::string_view::npos;
}

std::optional<std::string> iconFileOf(const PropertyList& info) {
    const PropertyList* value = info.find(BundleIconFileKey);
    if (value == nullptr) return std::string(kUsualIconFile);
    const std::string* name = value->asString();
    if (name == nullptr || !isPlainFileName(*name)) return std::nullopt;
    return *name;
}

}  // namespace

CairoIconRenderer::CairoIconRenderer(const RootDirectory& root,
                                     PropertyListSerialization& propertyLists)
    : root_(root), propertyLists_(propertyLists) {}

std::unique_ptr<AppBundle> CairoIconRenderer::openBundle(const FileURL& url) {
    const std::optional<Bytes> bytes =
        readSmallFile(root_, url.path() + "/Info.plist", kMaximumInfoBytes);
    if (!bytes) return nullptr;
    const Result<PropertyList> info = propertyLists_.parse(*bytes);
    if (!info || !info->isMap()) return nullptr;
    std::optional<std::string> iconFile = iconFileOf(*info);
    if (!iconFile) return nullptr;
    return std::make_unique<OpenBundle>(url.path(), *std::move(iconFile));
}

std::unique_ptr<IconImage> CairoIconRenderer::homeScreenIcon(const AppBundle& bundle) {
    const auto* open = dynamic_cast<const OpenBundle*>(&bundle);
    if (open == nullptr) return nullptr;
    const std::optional<Bytes> png = readSmallFile(root_, open->iconPath(), kMaximumIconFileBytes);
    if (!png) return nullptr;
    Result<Bytes> icon = renderIcon(*png);
    if (!icon) return nullptr;
    return std::make_unique<EncodedIcon>(*std::move(icon));
}

std::unique_ptr<ImageDestination> CairoIconRenderer::createImageDestination(
    std::string_view typeIdentifier, std::size_t imageCount, Bytes& buffer) {
    if (typeIdentifier != kPngType || imageCount == 0) return nullptr;
    return std::make_unique<PngDestination>(buffer);
}

}  // namespace appsync
