#pragma once

#include <cmath>
#include <cstdint>
#include <limits>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "system/property_list/PropertyListCodec.h"

namespace appsync {

inline Bytes bytesOf(std::string_view text) { return {text.begin(), text.end()}; }
inline std::string textOf(const Bytes& bytes) { return {bytes.begin(), bytes.end()}; }

/// A document around one value.
inline std::string xml(std::string_view value) {
    return "<plist version=\"1.0\">\n" + std::string(value) + "\n</plist>\n";
}

inline Result<PropertyList> parse(const Bytes& bytes) { return SystemPropertyLists().parse(bytes); }
inline Result<PropertyList> parse(std::string_view text) { return parse(bytesOf(text)); }

/// Why something is not read; "read" when it is.
template <typename Input>
std::string refusal(const Input& input) {
    const auto result = parse(input);
    return result ? "read" : result.error().description();
}

inline Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) {
    return SystemPropertyLists().serialize(value, format);
}

inline Bytes binary(const PropertyList& value) {
    return *serialize(value, PropertyListFormat::Binary);
}

/// The value after writing and reading; the null marker when one of them fails.
inline PropertyList roundTrip(const PropertyList& value, PropertyListFormat format) {
    const auto bytes = serialize(value, format);
    if (!bytes) return {};
    auto result = parse(*bytes);
    return result ? std::move(*result) : PropertyList();
}

/// Values of every kind, with their edges, that both encodings can carry.
inline std::vector<PropertyList> sampleValues() {
    using Date = PropertyList::Date;
    const double infinity = std::numeric_limits<double>::infinity();
    return {
        true,
        false,
        0,
        1,
        -1,
        127,
        128,
        255,
        256,
        65535,
        65536,
        -65536,
        4294967295U,
        4294967296,
        INT64_MAX,
        INT64_MIN,
        UINT64_MAX,
        std::uint64_t{1} << 63U,
        0.0,
        -0.0,
        0.1,
        -2.5,
        1e300,
        5e-324,
        1e16,
        123456789.0,
        infinity,
        -infinity,
        std::numeric_limits<double>::quiet_NaN(),
        std::numeric_limits<double>::max(),
        Date{0},
        Date{-1},
        Date{-63113904000.0},
        Date{252423993599},
        Bytes{},
        Bytes{0},
        Bytes{1, 2},
        Bytes{1, 2, 3},
        Bytes(1000, 0xA5),
        "",
        "text",
        " ",
        "  two  ",
        "\n\t",
        "a\rb\r\nc\n",
        "<&>\"'",
        "]]>",
        "Gr\u00fc\u00dfe",
        "\u20ac \U0001F600",
        "\u0085\u2028",
        std::string(14, 'x'),
        std::string(15, 'x'),
        std::string(300, 'y'),
        std::string(70000, 'z'),
        PropertyList::array(),
        PropertyList::map(),
        PropertyList::array({1, "x", PropertyList::array({"x"}), PropertyList::map({{"x", "x"}})}),
        PropertyList::map({{"", 1}, {"a b", 2}, {"\u20ac", 3}, {"<&>", PropertyList::map()}}),
    };
}

/// `depth` arrays in one another.
inline PropertyList nestedArrays(std::size_t depth) {
    PropertyList value = PropertyList::array();
    for (std::size_t i = 1; i < depth; ++i) {
        PropertyList outer = PropertyList::array();
        outer.append(std::move(value));
        value = std::move(outer);
    }
    return value;
}

inline PropertyList todoList(int count) {
    PropertyList list = PropertyList::array(count);
    for (int i = 0; i < count; ++i) {
        list.append(PropertyList::map({{"identifier", "com.example." + std::to_string(i)},
                                       {"operation", "install"},
                                       {"name", "\u00dcbung & " + std::to_string(i)},
                                       {"size", i * 1000}}));
    }
    return list;
}

/// Puts a binary property list together by hand, objects numbered in the order in which they come.
class BinaryList {
  public:
    BinaryList& add(std::string_view object) {
        offsets_.push_back(8 + objects_.size());
        objects_ += object;
        return *this;
    }
    BinaryList& referenceWidth(int width) { return referenceWidth_ = width, *this; }
    BinaryList& objectCount(std::uint64_t count) { return count_ = count, *this; }
    BinaryList& top(std::uint64_t number) { return top_ = number, *this; }
    BinaryList& offsetOf(std::size_t object, std::size_t offset) {
        return offsets_[object] = offset, *this;
    }

    [[nodiscard]] Bytes bytes() const {
        std::string all = "bplist00" + objects_;
        const std::size_t table = all.size();
        for (const std::size_t offset : offsets_) all += number(offset, 2);
        all += number(0, 6) + number(2, 1) + number(static_cast<std::uint64_t>(referenceWidth_), 1);
        all += number(count_ == UINT64_MAX ? offsets_.size() : count_, 8) + number(top_, 8);
        return bytesOf(all + number(table, 8));
    }

    static std::string number(std::uint64_t value, int width) {
        std::string digits;
        for (int i = width - 1; i >= 0; --i) digits += static_cast<char>(value >> (8 * i) & 0xFFU);
        return digits;
    }

  private:
    std::string objects_;
    std::vector<std::size_t> offsets_;
    int referenceWidth_ = 1;
    std::uint64_t count_ = UINT64_MAX;
    std::uint64_t top_ = 0;
};

}  // namespace appsync
