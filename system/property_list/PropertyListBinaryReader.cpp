#include "system/property_list/PropertyListBinaryReader.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cmath>
#include <cstring>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "system/property_list/PropertyListBinaryFormat.h"
#include "system/property_list/PropertyListErrors.h"
#include "system/property_list/PropertyListText.h"

namespace appsync {

namespace {

class BinaryReader {
  public:
    explicit BinaryReader(ByteView bytes)
        : bytes_(bytes),
          valuesLeft_(bytes.size() + kBinaryFreeValues),
          longBytesLeft_(bytes.size()),
          keyBytesLeft_(bytes.size() * kBinaryCopiedSize + kBinaryFreeKeyBytes) {}

    Result<PropertyList> read() {
        PropertyList value;
        if (readTrailer() && readObject(trailer_.top, bytes_.size() - 16, value)) return value;
        return binaryReadError(problemAt_, problem_);
    }

  private:
    /// The content of an object: where it begins and its size in bytes.
    struct Span {
        std::size_t at = 0;
        std::size_t size = 0;
    };

    // Cold: what leads there is kept apart from what is read in each object.
    [[gnu::cold]] bool refuse(std::size_t at, std::string problem) {
        problemAt_ = at;
        problem_ = std::move(problem);
        return false;
    }

    bool readTrailer() {
        if (bytes_.size() < kBinaryMagic.size() + kBinaryTrailerSize + 2) {
            return refuse(bytes_.size(),
                          "expected at least " +
                              std::to_string(kBinaryMagic.size() + kBinaryTrailerSize + 2) +
                              " bytes, found the end");
        }
        const std::size_t trailer = bytes_.size() - kBinaryTrailerSize;
        trailer_ = readBinaryTrailer(bytes_.data() + trailer);
        return checkTrailer(trailer);
    }

    bool checkTrailer(std::size_t trailer) {
        if (trailer_.offsetWidth < 1 || trailer_.offsetWidth > 8) {
            return refuse(trailer + 6, "expected the width of an offset, 1 to 8");
        }
        if (trailer_.referenceWidth < 1 || trailer_.referenceWidth > 8) {
            return refuse(trailer + 7, "expected the width of a reference, 1 to 8");
        }
        if (trailer_.table <= kBinaryMagic.size() || trailer_.table >= trailer) {
            return refuse(trailer + 24,
                          "expected the place of the offset table, between the "
                          "header and the trailer");
        }
        const std::size_t tableSize = trailer - trailer_.table;
        if (trailer_.objectCount != tableSize / trailer_.offsetWidth ||
            tableSize % trailer_.offsetWidth != 0) {
            return refuse(trailer + 8, "expected the number of objects, one for each " +
                                           std::to_string(trailer_.offsetWidth) +
                                           " bytes of the offset table");
        }
        return true;
    }

    /// Every value here is the null marker until it is read, which holds nothing that would have to
    /// be destroyed.
    template <typename Content>
    static void fill(PropertyList& value, Content&& content) {
        std::construct_at(&value, std::forward<Content>(content));
    }

    /// Reads the object that is referred to at `from`.
    bool readObject(std::uint64_t reference, std::size_t from, PropertyList& value) {
        std::size_t at = 0;
        if (!locate(reference, from, at)) return false;
        switch (kindOf(bytes_[at])) {
            case kBinaryInteger:
                return readInteger(at, value);
            case kBinaryReal:
                return readReal(at, value);
            case kBinaryData:
            case kBinaryAscii:
            case kBinaryUtf16:
                return readBlock(at, value);
            case kBinaryArray:
                return readContainer(at, &BinaryReader::readArray, value);
            case kBinaryMap:
                return readContainer(at, &BinaryReader::readMap, value);
            default:
                return readSimple(at, value);
        }
    }

    /// Where the object stands that is referred to at `from`.
    bool locate(std::uint64_t reference, std::size_t from, std::size_t& at) {
        if (reference >= trailer_.objectCount) {
            return refuse(from, "expected the number of an object below " +
                                    std::to_string(trailer_.objectCount) + ", found " +
                                    std::to_string(reference));
        }
        const std::size_t entry =
            trailer_.table + static_cast<std::size_t>(reference) * trailer_.offsetWidth;
        const std::uint64_t offset = bigEndian(bytes_.data() + entry, trailer_.offsetWidth);
        if (offset < kBinaryMagic.size() || offset >= trailer_.table) {
            return refuse(entry,
                          "expected the offset of an object, between the header and the "
                          "offset table, found " +
                              std::to_string(offset));
        }
        at = static_cast<std::size_t>(offset);
        return true;
    }

    bool readSimple(std::size_t at, PropertyList& value) {
        const std::uint8_t marker = bytes_[at];
        if (marker == kBinaryDate) return readDate(at, value);
        if (marker != kBinaryFalse && marker != kBinaryTrue) {
            return refuse(at,
                          "expected a value (boolean, integer, real, date, data, string, array "
                          "or map), found an object of kind " +
                              std::to_string(marker));
        }
        fill(value, marker == kBinaryTrue);
        return true;
    }

    /// Whether so many bytes are left for objects.
    bool checkSize(std::size_t at, std::uint64_t size) {
        return size <= trailer_.table - at || refuse(at, "expected " + std::to_string(size) +
                                                             " more bytes before the offset "
                                                             "table, found " +
                                                             std::to_string(trailer_.table - at));
    }

    bool readInteger(std::size_t at, PropertyList& value) {
        const std::uint8_t exponent = lowerHalf(bytes_[at]);
        if (exponent > 4) return refuse(at, "expected an integer of 1, 2, 4, 8 or 16 bytes");
        const std::size_t width = std::size_t{1} << exponent;
        if (!checkSize(at + 1, width)) return false;
        const std::uint8_t* content = bytes_.data() + at + 1;
        if (width < 16) {
            // Narrow ones have no sign; those of 8 bytes do.
            fill(value, static_cast<std::int64_t>(bigEndian(content, width)));
            return true;
        }
        return readWideInteger(at, bigEndian(content, 8), bigEndian(content + 8, 8), value);
    }

    bool readWideInteger(std::size_t at, std::uint64_t high, std::uint64_t low,
                         PropertyList& value) {
        const bool negative = low >> 63U != 0;
        if (high == 0 && negative) {
            fill(value, low);
        } else if (high == (negative ? UINT64_MAX : 0)) {
            fill(value, static_cast<std::int64_t>(low));
        } else {
            return refuse(at, "expected an integer of at most 64 bits");
        }
        return true;
    }

    bool readReal(std::size_t at, PropertyList& value) {
        const std::uint8_t exponent = lowerHalf(bytes_[at]);
        if (exponent != 2 && exponent != 3) {
            return refuse(at, "expected a real number of 4 or 8 bytes");
        }
        const std::size_t width = std::size_t{1} << exponent;
        if (!checkSize(at + 1, width)) return false;
        const std::uint64_t bits = bigEndian(bytes_.data() + at + 1, width);
        fill(value, width == 8 ? std::bit_cast<double>(bits)
                               : double{std::bit_cast<float>(static_cast<std::uint32_t>(bits))});
        return true;
    }

    bool readDate(std::size_t at, PropertyList& value) {
        if (!checkSize(at + 1, 8)) return false;
        const std::uint64_t bits = bigEndian(bytes_.data() + at + 1, 8);
        const auto seconds = std::bit_cast<double>(bits);
        if (!std::isfinite(seconds)) {
            return refuse(at, "expected a date, found one that is no point in time");
        }
        fill(value, PropertyList::Date{seconds});
        return true;
    }

    /// The content of an object that counts units of so many bytes.
    bool readSpan(std::size_t at, std::size_t unit, Span& span) {
        std::uint64_t count = lowerHalf(bytes_[at]);
        std::size_t begin = at + 1;
        if (count == kBinaryCountFollows && !readCount(begin, count)) return false;
        if (count > (trailer_.table - begin) / unit) {
            return refuse(at, "expected a count that " + std::to_string(trailer_.table - begin) +
                                  " bytes before the offset table can hold, found " +
                                  std::to_string(count));
        }
        span = {begin, static_cast<std::size_t>(count) * unit};
        return true;
    }

    /// Reads a count that stands as an integer object at `at`, and moves `at` behind it.
    bool readCount(std::size_t& at, std::uint64_t& count) {
        if (!checkSize(at, 1)) return false;
        const std::uint8_t exponent = lowerHalf(bytes_[at]);
        if (kindOf(bytes_[at]) != kBinaryInteger || exponent > 3) {
            return refuse(at, "expected a count, an integer of 1, 2, 4 or 8 bytes");
        }
        const std::size_t width = std::size_t{1} << exponent;
        if (!checkSize(at + 1, width)) return false;
        count = bigEndian(bytes_.data() + at + 1, width);
        at += 1 + width;
        return true;
    }

    /// Reads a string or data. Long ones are made once and shared by all that refer to them.
    bool readBlock(std::size_t at, PropertyList& value) {
        Span span;
        if (!readSpan(at, kindOf(bytes_[at]) == kBinaryUtf16 ? 2 : 1, span)) return false;
        if (span.size <= kBinaryCopiedSize) return makeBlock(at, span, value);
        if (const auto known = longBlocks_.find(at); known != longBlocks_.end()) {
            fill(value, known->second);
            return true;
        }
        if (span.size > longBytesLeft_) {
            return refuse(at, "expected texts and data that do not overlap");
        }
        longBytesLeft_ -= span.size;
        if (!makeBlock(at, span, value)) return false;
        longBlocks_.emplace(at, value);
        return true;
    }

    bool makeBlock(std::size_t at, Span span, PropertyList& value) {
        const ByteView content = bytes_.subspan(span.at, span.size);
        const std::uint8_t kind = kindOf(bytes_[at]);
        if (kind == kBinaryData) {
            fill(value, Bytes(content.begin(), content.end()));
            return true;
        }
        if (kind == kBinaryAscii && span.size <= kBinaryCopiedSize) {
            std::string_view text;
            if (!readAscii(span, text)) return false;
            fill(value, text);
            return true;
        }
        std::string text;
        if (!readText(at, span, text)) return false;
        value = span.size <= kBinaryCopiedSize
                    ? PropertyList(std::move(text))
                    : PropertyList::shared(std::make_shared<const std::string>(std::move(text)));
        return true;
    }

    bool readText(std::size_t at, Span span, std::string& text) {
        if (kindOf(bytes_[at]) == kBinaryUtf16) {
            const auto bad = appendUtf16AsUtf8(bytes_.subspan(span.at, span.size), text);
            return !bad ||
                   refuse(span.at + *bad, "expected UTF-16, found half of a surrogate pair");
        }
        std::string_view ascii;
        if (!readAscii(span, ascii)) return false;
        text.assign(ascii);
        return true;
    }

    bool readAscii(Span span, std::string_view& text) {
        const ByteView content = bytes_.subspan(span.at, span.size);
        text = {reinterpret_cast<const char*>(content.data()), content.size()};
        const std::size_t ascii = asciiPrefix(text);
        return ascii == text.size() || refuse(span.at + ascii, "expected an ASCII character");
    }

    using ReadContent = bool (BinaryReader::*)(Span, PropertyList&);

    bool readContainer(std::size_t at, ReadContent readContent, PropertyList& value) {
        if (std::find(open_.begin(), open_.end(), at) != open_.end()) {
            return refuse(at, "expected a container that is not inside itself");
        }
        if (open_.size() == PropertyList::kMaximumDepth) {
            return refuse(at, "expected at most 128 containers in one another");
        }
        const std::size_t width =
            trailer_.referenceWidth * (kindOf(bytes_[at]) == kBinaryMap ? 2U : 1U);
        Span span;
        if (!readSpan(at, width, span)) return false;
        const std::size_t count = span.size / width;
        if (count > valuesLeft_) {
            return refuse(at,
                          "expected no more values than an input of this size can hold; shared "
                          "containers make this one larger");
        }
        valuesLeft_ -= count;
        open_.push_back(at);
        if (!(this->*readContent)(span, value)) return false;
        open_.pop_back();
        return true;
    }

    [[nodiscard]] std::uint64_t referenceAt(std::size_t at) const {
        return bigEndian(bytes_.data() + at, trailer_.referenceWidth);
    }

    bool readArray(Span span, PropertyList& value) {
        std::vector<PropertyList> elements(span.size / trailer_.referenceWidth);
        std::size_t at = span.at;
        for (PropertyList& element : elements) {
            if (!readObject(referenceAt(at), at, element)) return false;
            at += trailer_.referenceWidth;
        }
        return value.becomeArray(elements);
    }

    bool readMap(Span span, PropertyList& value) {
        std::vector<PropertyList::Entry> entries(span.size / 2 / trailer_.referenceWidth);
        std::size_t at = span.at;
        std::size_t place = 0;
        for (auto& [key, inner] : entries) {
            const std::size_t valueAt = at + span.size / 2;
            if (!readKeyAt(place++, at, key) || !readObject(referenceAt(valueAt), valueAt, inner))
                return false;
            at += trailer_.referenceWidth;
        }
        if (value.becomeMap(entries)) return true;
        const std::size_t repeated = PropertyList::findRepeatedKey(entries).value_or(0);
        return refuse(span.at + repeated * trailer_.referenceWidth,
                      "expected a key that the map does not have yet");
    }

    /// Maps of one list mostly have the same keys at the same places: what the map before had there
    /// is not looked up again.
    bool readKeyAt(std::size_t place, std::size_t from, std::string& key) {
        if (place >= kRememberedKeys) return readKey(from, key);
        Key& before = keys_[place];
        const std::uint64_t reference = referenceAt(from);
        if (before.isKnown && before.reference == reference) {
            key = before.text;
            return true;
        }
        if (!readKey(from, key)) return false;
        before.isKnown = key.size() <= kBinaryCopiedSize;
        if (before.isKnown) before.reference = reference, before.text = key;
        return true;
    }

    /// Reads the key that is referred to at `from`.
    bool readKey(std::size_t from, std::string& key) {
        std::size_t at = 0;
        if (!locate(referenceAt(from), from, at)) return false;
        const std::uint8_t kind = kindOf(bytes_[at]);
        if (kind != kBinaryAscii && kind != kBinaryUtf16) {
            return refuse(at, "expected a string, the key of an entry");
        }
        Span span;
        if (!readSpan(at, kind == kBinaryUtf16 ? 2 : 1, span)) return false;
        if (span.size <= kBinaryCopiedSize) return readText(at, span, key);
        return readLongKey(at, key);
    }

    bool readLongKey(std::size_t at, std::string& key) {
        PropertyList shared;
        if (!readBlock(at, shared)) return false;
        const std::string& text = *shared.asString();
        if (text.size() > keyBytesLeft_) {
            return refuse(at, "expected keys that an input of this size can hold");
        }
        keyBytesLeft_ -= text.size();
        key = text;
        return true;
    }

    /// A short key and what refers to it.
    struct Key {
        std::uint64_t reference = 0;
        std::string text;
        bool isKnown = false;
    };
    static constexpr std::size_t kRememberedKeys = 16;

    ByteView bytes_;
    BinaryTrailer trailer_;

    std::size_t valuesLeft_;
    std::size_t longBytesLeft_;
    std::size_t keyBytesLeft_;
    std::array<Key, kRememberedKeys> keys_;  // at their places in the map before
    std::vector<std::size_t> open_;          // where the containers stand that are being read
    std::unordered_map<std::size_t, PropertyList> longBlocks_;  // by where they stand

    std::size_t problemAt_ = 0;
    std::string problem_;
};

}  // namespace

Result<PropertyList> readBinaryPropertyList(ByteView bytes) { return BinaryReader(bytes).read(); }

}  // namespace appsync
