#include "system/property_list/PropertyListBinaryEdit.h"

#include <cstdint>
#include <optional>

#include "system/property_list/PropertyListBinaryFormat.h"

namespace appsync {

namespace {

/// Looks up single objects. Nothing is believed of the bytes: what leads elsewhere is not found.
class BinaryObjects {
  public:
    /// An array or a map: how many elements it has, and where the first reference stands.
    struct Container {
        std::size_t count = 0;
        std::size_t references = 0;
    };

    explicit BinaryObjects(ByteView bytes) : bytes_(bytes) {}

    /// Reads the trailer. False when there is none that leads anywhere.
    bool begin() {
        if (bytes_.size() < kBinaryMagic.size() + kBinaryTrailerSize) return false;
        const std::size_t trailer = bytes_.size() - kBinaryTrailerSize;
        trailer_ = readBinaryTrailer(bytes_.data() + trailer);
        const auto isWidth = [](std::size_t width) { return width >= 1 && width <= 8; };
        if (!isWidth(trailer_.offsetWidth) || !isWidth(trailer_.referenceWidth)) return false;
        return trailer_.table <= trailer &&
               trailer_.objectCount <= (trailer - trailer_.table) / trailer_.offsetWidth;
    }

    [[nodiscard]] std::uint64_t top() const { return trailer_.top; }
    [[nodiscard]] std::size_t count() const {
        return static_cast<std::size_t>(trailer_.objectCount);
    }
    [[nodiscard]] std::size_t referenceWidth() const { return trailer_.referenceWidth; }

    /// Where the reference of this number stands, of those that begin at `references`.
    [[nodiscard]] std::size_t placeOfReference(std::size_t references, std::size_t number) const {
        return references + number * trailer_.referenceWidth;
    }
    [[nodiscard]] std::uint64_t reference(std::size_t references, std::size_t number) const {
        return bigEndian(bytes_.data() + placeOfReference(references, number),
                         trailer_.referenceWidth);
    }

    /// An array has one reference for each element, a map two.
    [[nodiscard]] std::optional<Container> container(std::uint64_t object,
                                                     std::uint8_t kind) const {
        const std::size_t at = placeOf(object);
        if (at == 0 || kindOf(bytes_[at]) != kind) return std::nullopt;
        Container found{lowerHalf(bytes_[at]), at + 1};
        if (found.count == kBinaryCountFollows && !readCount(found)) return std::nullopt;
        const std::size_t each = trailer_.referenceWidth * (kind == kBinaryMap ? 2 : 1);
        if (found.references > trailer_.table) return std::nullopt;
        if (found.count > (trailer_.table - found.references) / each) return std::nullopt;
        return found;
    }

    /// Whether the object is this text, which is a short one.
    [[nodiscard]] bool isText(std::uint64_t object, std::string_view text) const {
        const std::size_t at = placeOf(object);
        if (at == 0 || bytes_[at] != (kBinaryAscii | text.size())) return false;
        if (text.size() > trailer_.table - at - 1) return false;
        const auto* content = reinterpret_cast<const char*>(bytes_.data() + at + 1);
        return std::string_view(content, text.size()) == text;
    }

  private:
    /// 0 for an object that is none.
    [[nodiscard]] std::size_t placeOf(std::uint64_t object) const {
        if (object >= trailer_.objectCount) return 0;
        const std::size_t entry =
            static_cast<std::size_t>(trailer_.table + object * trailer_.offsetWidth);
        const std::uint64_t offset = bigEndian(bytes_.data() + entry, trailer_.offsetWidth);
        if (offset < kBinaryMagic.size() || offset >= trailer_.table) return 0;
        return static_cast<std::size_t>(offset);
    }

    /// The count is an integer object that stands where the references would begin.
    bool readCount(Container& container) const {
        const std::size_t at = container.references;
        if (at >= trailer_.table || kindOf(bytes_[at]) != kBinaryInteger) return false;
        if (lowerHalf(bytes_[at]) > 3) return false;
        const std::size_t width = std::size_t{1} << lowerHalf(bytes_[at]);
        if (width > trailer_.table - at - 1) return false;
        container.count = static_cast<std::size_t>(bigEndian(bytes_.data() + at + 1, width));
        container.references = at + 1 + width;
        return true;
    }

    ByteView bytes_;
    BinaryTrailer trailer_;
};

/// Where the map refers to what it has under the key.
std::optional<std::size_t> placeOfValue(const BinaryObjects& objects, std::uint64_t map,
                                        std::string_view key) {
    const auto entries = objects.container(map, kBinaryMap);
    if (!entries) return std::nullopt;
    for (std::size_t number = 0; number < entries->count; ++number) {
        if (objects.isText(objects.reference(entries->references, number), key)) {
            return objects.placeOfReference(entries->references, entries->count + number);
        }
    }
    return std::nullopt;
}

std::optional<std::size_t> objectOf(const BinaryObjects& objects, std::string_view text) {
    for (std::size_t object = 0; object < objects.count(); ++object) {
        if (objects.isText(object, text)) return object;
    }
    return std::nullopt;
}

}  // namespace

bool replaceBinaryText(Bytes& bytes, std::size_t index, std::string_view key,
                       std::string_view text) {
    if (key.size() >= kBinaryCountFollows || text.size() >= kBinaryCountFollows) return false;
    BinaryObjects objects(bytes);
    if (!objects.begin()) return false;
    const auto array = objects.container(objects.top(), kBinaryArray);
    if (!array || index >= array->count) return false;
    const auto place = placeOfValue(objects, objects.reference(array->references, index), key);
    if (!place) return false;
    const auto object = objectOf(objects, text);
    if (!object) return false;
    std::uint64_t rest = *object;
    for (std::size_t byte = objects.referenceWidth(); byte-- > 0; rest >>= 8U) {
        bytes[*place + byte] = static_cast<std::uint8_t>(rest);
    }
    return true;
}

}  // namespace appsync
