#include "system/property_list/PropertyListBinaryWriter.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cmath>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/PropertyListKeyIndex.h"
#include "system/property_list/PropertyListBinaryFormat.h"
#include "system/property_list/PropertyListErrors.h"
#include "system/property_list/PropertyListText.h"

namespace appsync {

namespace {

/// How many bytes (1, 2, 4 or 8) hold a number.
std::size_t widthOf(std::uint64_t value) {
    if (value <= 0xFF) return 1;
    if (value <= 0xFFFF) return 2;
    return value <= 0xFFFFFFFF ? 4 : 8;
}

/// The same, 3 and 5 to 7 bytes allowed too.
std::size_t tightWidthOf(std::uint64_t value) {
    std::size_t width = 1;
    while (width < 8 && value >> (8 * width) != 0) ++width;
    return width;
}

std::uint8_t exponentOf(std::size_t width) {
    return static_cast<std::uint8_t>(std::countr_zero(width));
}

class BinaryWriter {
  public:
    Result<Bytes> write(const PropertyList& root) {
        // Level by level: a container's elements get their numbers when it is met in the list, so
        // neither this loop nor the next recurses.
        addValue(root);
        for (std::size_t i = 0; i < objects_.size(); ++i) {
            if (objects_[i].text == nullptr) addElements(objects_[i].value());
        }
        referenceWidth_ = tightWidthOf(objects_.size() - 1);
        bytes_.resize(kBinaryMagic.size() + textBytes_ + references_.size() * referenceWidth_ +
                      objects_.size() * 16 + kBinaryTrailerSize);
        putBytes(kBinaryMagic.data(), kBinaryMagic.size());
        offsets_.reserve(objects_.size());
        for (const Object& object : objects_) {
            offsets_.push_back(size_);
            if (!writeObject(object)) return writeError(root, object.part, problem_);
        }
        writeTableAndTrailer();
        if (keyBytes_ > size_ * kBinaryCopiedSize + kBinaryFreeKeyBytes) {
            return writeError(root, &root, "the same long keys repeat too often; write it as XML");
        }
        bytes_.resize(size_);
        return std::move(bytes_);
    }

  private:
    /// One object of the output: a value other than a string, or a string. Small, as there are
    /// many.
    struct Object {
        const void* part = nullptr;  // the first value or key that it stands for
        const std::string* text = nullptr;

        [[nodiscard]] const PropertyList& value() const {
            return *static_cast<const PropertyList*>(part);
        }
    };

    std::size_t add(const Object& object) {
        objects_.push_back(object);
        return objects_.size() - 1;
    }

    std::size_t addValue(const PropertyList& value) {
        if (const std::string* text = value.asString()) return addText(*text, &value);
        if (const auto content = value.asBoolean()) {
            std::optional<std::size_t>& known = booleans_[*content ? 1 : 0];
            if (!known) known = add({&value, nullptr});
            return *known;
        }
        return add({&value, nullptr});
    }

    /// Maps of one list mostly have the same keys, and often the same texts, at the same places:
    /// what the map before had there is tried first. `place` counts keys and values.
    std::size_t addTextAt(std::size_t place, const std::string& text, const void* part) {
        if (place >= kRememberedPlaces) return addText(text, part);
        std::size_t& before = textOfPlace_[place];
        if (before >= objects_.size() || objects_[before].text == nullptr ||
            *objects_[before].text != text) {
            before = addText(text, part);
        }
        return before;
    }

    std::size_t addValueAt(std::size_t place, const PropertyList& value) {
        if (const std::string* text = value.asString()) return addTextAt(place, *text, &value);
        return addValue(value);
    }

    std::size_t addText(const std::string& text, const void* part) {
        const std::uint32_t hash = PropertyListKeyIndex::hashOf(text);
        const auto textAt = [this](std::size_t i) -> std::string_view {
            return *objects_[textObjects_[i]].text;
        };
        if (const auto known = textIndex_.find(hash, text, textAt)) return textObjects_[*known];
        if (textObjects_.size() < PropertyListKeyIndex::kMaximumSize) {
            textIndex_.add(hash, textObjects_.size());
            textObjects_.push_back(objects_.size());
        }
        textBytes_ += text.size();
        return add({part, &text});
    }

    void addElements(const PropertyList& container) {
        for (const PropertyList& element : container.elements()) {
            references_.push_back(addValue(element));
        }
        std::size_t place = 0;
        for (const auto& [key, value] : container.entries()) {
            keyBytes_ += key.size();
            references_.push_back(addTextAt(place++, key, &key));
        }
        for (const auto& [key, value] : container.entries()) {
            references_.push_back(addValueAt(place++, value));
        }
    }

    bool writeObject(const Object& object) {
        if (object.text != nullptr) return writeText(*object.text);
        const PropertyList& value = object.value();
        using Kind = PropertyList::Kind;
        switch (value.kind()) {
            case Kind::Null:
                problem_ = "the null marker cannot be written; remove it";
                return false;
            case Kind::Boolean:
                return putByte(*value.asBoolean() ? kBinaryTrue : kBinaryFalse), true;
            case Kind::Integer:
            case Kind::Unsigned:
                return writeInteger(value), true;
            case Kind::Real:
                return writeReal(*value.asReal()), true;
            case Kind::Date:
                return writeDate(value.asDate()->secondsSince2001);
            case Kind::Data:
                return putBlock(kBinaryData, *value.asData()), true;
            case Kind::Array:
                putMarker(kBinaryArray, value.size());
                return writeReferences(value.size()), true;
            case Kind::Map:
                putMarker(kBinaryMap, value.size());
                return writeReferences(value.size() * 2), true;
            case Kind::String:
                return writeText(*value.asString());
        }
        return false;
    }

    void writeInteger(const PropertyList& value) {
        const auto fitting = value.asInteger();
        if (!fitting) {
            // Eight bytes would read as a negative number.
            putByte(kBinaryInteger | 4U);
            putNumber(0, 8);
            return putNumber(*value.asUnsigned(), 8);
        }
        putInteger(static_cast<std::uint64_t>(*fitting));
    }

    void putInteger(std::uint64_t value) {
        const std::size_t width = widthOf(value);
        putByte(static_cast<std::uint8_t>(kBinaryInteger | exponentOf(width)));
        putNumber(value, width);
    }

    bool writeDate(double seconds) {
        if (!std::isfinite(seconds)) {
            problem_ = kNoTime;
            return false;
        }
        putByte(kBinaryDate);
        return putBits(seconds), true;
    }

    void writeReal(double value) {
        const auto narrow = static_cast<float>(value);
        if (double{narrow} != value) {
            putByte(kBinaryReal | 3U);
            return putBits(value);
        }
        putByte(kBinaryReal | 2U);
        putNumber(std::bit_cast<std::uint32_t>(narrow), 4);
    }

    bool writeText(std::string_view text) {
        if (asciiPrefix(text) == text.size()) {
            putMarker(kBinaryAscii, text.size());
            return putBytes(text.data(), text.size()), true;
        }
        const auto wide = utf16FromUtf8(text);
        if (!wide) {
            problem_ = "the text is not UTF-8";
            return false;
        }
        putMarker(kBinaryUtf16, wide->size() / 2);
        return putBytes(wide->data(), wide->size()), true;
    }

    void putBlock(std::uint8_t kind, ByteView bytes) {
        putMarker(kind, bytes.size());
        putBytes(bytes.data(), bytes.size());
    }

    /// Containers are met in the order in which their references were noted.
    void writeReferences(std::size_t count) {
        makeRoom(count * referenceWidth_);
        for (; count != 0; --count) store(references_[nextReference_++], referenceWidth_);
    }

    void writeTableAndTrailer() {
        const std::size_t table = size_;
        const std::size_t width = tightWidthOf(table);
        makeRoom(offsets_.size() * width);
        for (const std::size_t offset : offsets_) store(offset, width);
        putNumber(0, 6);
        putByte(static_cast<std::uint8_t>(width));
        putByte(static_cast<std::uint8_t>(referenceWidth_));
        putNumber(objects_.size(), 8);
        putNumber(0, 8);
        putNumber(table, 8);
    }

    void putMarker(std::uint8_t kind, std::size_t count) {
        if (count < kBinaryCountFollows) return putByte(static_cast<std::uint8_t>(kind | count));
        putByte(kind | kBinaryCountFollows);
        putInteger(count);
    }

    void putByte(std::uint8_t byte) { putNumber(byte, 1); }
    void putBits(double value) { putNumber(std::bit_cast<std::uint64_t>(value), 8); }

    void putBytes(const void* bytes, std::size_t count) {
        if (count == 0) return;
        makeRoom(count);
        std::memcpy(bytes_.data() + size_, bytes, count);
        size_ += count;
    }

    void putNumber(std::uint64_t value, std::size_t width) {
        makeRoom(width);
        store(value, width);
    }

    /// Has so many bytes, and those that `store` writes beyond, fit.
    void makeRoom(std::size_t count) {
        const std::size_t needed = size_ + count + sizeof(std::uint64_t);
        if (needed > bytes_.size()) bytes_.resize(std::max(needed, bytes_.size() * 2));
    }

    /// The last `width` bytes of a number, 1 to 8, the highest first; those behind them are written
    /// over by what follows.
    void store(std::uint64_t value, std::size_t width) {
        value <<= 8 * (sizeof(value) - width);
        if constexpr (std::endian::native == std::endian::little) value = __builtin_bswap64(value);
        std::memcpy(bytes_.data() + size_, &value, sizeof(value));
        size_ += width;
    }

    static constexpr std::size_t kRememberedPlaces = 16;

    std::vector<Object> objects_;
    std::vector<std::size_t> references_;  // of all containers, one after the other
    std::vector<std::size_t> textObjects_;
    PropertyListKeyIndex textIndex_;                            // into textObjects_
    std::array<std::size_t, kRememberedPlaces> textOfPlace_{};  // into objects_
    std::array<std::optional<std::size_t>, 2> booleans_;
    std::size_t textBytes_ = 0;
    std::size_t keyBytes_ = 0;

    Bytes bytes_;
    std::size_t size_ = 0;  // of what is written of them
    std::vector<std::size_t> offsets_;
    std::size_t referenceWidth_ = 1;
    std::size_t nextReference_ = 0;
    std::string_view problem_;
};

}  // namespace

Result<Bytes> writeBinaryPropertyList(const PropertyList& value) {
    return BinaryWriter().write(value);
}

}  // namespace appsync
