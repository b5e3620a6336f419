#pragma once

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "platform/Bytes.h"

namespace appsync {

/// One property-list value: a map with string keys, an array, a string, a signed or unsigned 64-bit
/// integer, a real, a boolean, data, a date, or the null marker, which no encoder writes.
///
/// A value type: copying copies the whole tree, moving is cheap and leaves the null marker behind.
/// Values that are equal compare equal: an integer that both signed kinds can hold is the same
/// value in either, a real that is not a number equals itself, and two maps are equal when they
/// hold the same entries, in whatever order.
///
/// Containers nest at most `kMaximumDepth` deep. An edit that would go deeper is refused and
/// changes nothing; so there is no mutable access to an element of a container: `take` it, change
/// it, `set` it again (each of them is constant time).
///
/// Distinct values may be used on distinct threads; one value by one thread at a time, or by any
/// number that only read.
class PropertyList {
  public:
    /// Containers in containers: an empty array has depth 1, a string 0.
    static constexpr std::size_t kMaximumDepth = 128;

    enum class Kind { Null, Boolean, Integer, Unsigned, Real, Date, Data, String, Array, Map };

    /// A point in time: seconds since 2001-01-01 00:00:00 UTC, the epoch of both encodings.
    struct Date {
        double secondsSince2001 = 0;
        friend bool operator==(const Date&, const Date&) = default;
    };

    struct Entry;

    PropertyList() noexcept = default;  // the null marker
    PropertyList(const PropertyList& other);
    PropertyList(PropertyList&& other) noexcept : value_(std::move(other.value_)) {
        other.value_ = Storage();
    }
    PropertyList& operator=(const PropertyList& other);
    PropertyList& operator=(PropertyList&& other) noexcept {
        if (this == &other) return *this;
        value_ = std::move(other.value_);
        other.value_ = Storage();
        return *this;
    }
    ~PropertyList() = default;

    // Implicit on purpose: a property list is written down as its values.
    PropertyList(bool value) noexcept : value_(value) {}
    PropertyList(int value) noexcept : value_(std::int64_t{value}) {}
    PropertyList(unsigned int value) noexcept : value_(std::uint64_t{value}) {}
    PropertyList(long value) noexcept : value_(std::int64_t{value}) {}
    PropertyList(unsigned long value) noexcept : value_(std::uint64_t{value}) {}
    PropertyList(long long value) noexcept : value_(std::int64_t{value}) {}
    PropertyList(unsigned long long value) noexcept : value_(std::uint64_t{value}) {}
    PropertyList(double value) noexcept : value_(value) {}
    PropertyList(Date value) noexcept : value_(value) {}
    PropertyList(Bytes value);
    PropertyList(std::string value) noexcept : value_(std::move(value)) {}
    PropertyList(std::string_view value)
        : value_(std::in_place_type<std::string>, value.data(), value.size()) {}
    PropertyList(const char* value) : value_(std::in_place_type<std::string>, value) {}
    PropertyList(const void*) = delete;  // else a pointer would become a boolean

    /// A string or data that several values share (it never changes). The pointer is not null.
    [[nodiscard]] static PropertyList shared(std::shared_ptr<const std::string> text) noexcept;
    [[nodiscard]] static PropertyList shared(std::shared_ptr<const Bytes> data) noexcept;

    [[nodiscard]] static PropertyList array();
    /// An empty array; `capacity` elements are expected (a hint). A template, so that `array({1})`
    /// is an array of one element.
    template <std::integral Size>
    [[nodiscard]] static PropertyList array(Size capacity) {
        return arrayFor(static_cast<std::size_t>(capacity));
    }
    [[nodiscard]] static PropertyList array(std::initializer_list<PropertyList> elements);
    /// An array of strings.
    [[nodiscard]] static PropertyList strings(std::span<const std::string> elements);
    /// An empty map; `capacity` entries are expected (a hint).
    [[nodiscard]] static PropertyList map(std::size_t capacity = 0);
    /// A map of these entries; of entries with equal keys the last one counts.
    [[nodiscard]] static PropertyList map(
        std::initializer_list<std::pair<std::string_view, PropertyList>> entries);

    // For readers, which have all parts of a container before they have the container. Each becomes
    // that container, whose parts are moved out of the argument; or answers false and changes
    // nothing: the depth limit would be passed, or two entries have equal keys.
    [[nodiscard]] bool becomeArray(std::vector<PropertyList>& elements);
    [[nodiscard]] bool becomeMap(std::vector<Entry>& entries);
    /// The position of the first entry whose key an earlier one has too.
    [[nodiscard]] static std::optional<std::size_t> findRepeatedKey(std::span<const Entry> entries);

    [[nodiscard]] Kind kind() const noexcept;
    [[nodiscard]] bool isNull() const noexcept { return kind() == Kind::Null; }
    [[nodiscard]] bool isString() const noexcept { return kind() == Kind::String; }
    [[nodiscard]] bool isArray() const noexcept { return kind() == Kind::Array; }
    [[nodiscard]] bool isMap() const noexcept { return kind() == Kind::Map; }

    // The value, or nothing when it is of another kind. Pointers live until the value is changed.
    [[nodiscard]] std::optional<bool> asBoolean() const noexcept;
    /// Any integer that fits, whichever kind holds it.
    [[nodiscard]] std::optional<std::int64_t> asInteger() const noexcept;
    /// Any integer that is not negative, whichever kind holds it.
    [[nodiscard]] std::optional<std::uint64_t> asUnsigned() const noexcept;
    [[nodiscard]] std::optional<double> asReal() const noexcept;
    [[nodiscard]] std::optional<Date> asDate() const noexcept;
    [[nodiscard]] const Bytes* asData() const noexcept;
    [[nodiscard]] const std::string* asString() const noexcept;

    /// The tolerant boolean: true or false for a boolean or any number (0 is false) or a string
    /// that reads as one ("yes", "true", "1" ..., case ignored); nothing for every other kind.
    [[nodiscard]] std::optional<bool> booleanConversion() const noexcept;

    /// The number of elements or entries; 0 for what is not a container.
    [[nodiscard]] std::size_t size() const noexcept;
    [[nodiscard]] bool empty() const noexcept { return size() == 0; }
    /// How deep containers nest in this value, itself included (an upper bound after removals; an
    /// edit is refused for the true depth only).
    [[nodiscard]] std::size_t depth() const noexcept;

    // Arrays. Each answers nothing, null or false when the value is not an array, the index is out
    // of range, or the depth limit would be passed; nothing is changed then.
    [[nodiscard]] std::span<const PropertyList> elements() const noexcept;
    [[nodiscard]] const PropertyList* at(std::size_t index) const noexcept;
    bool append(PropertyList element);
    bool set(std::size_t index, PropertyList element);
    /// Moves the element out and leaves the null marker in its place.
    [[nodiscard]] PropertyList take(std::size_t index);

    // Maps, in insertion order. Look-up does not grow with the number of entries of large maps.
    // Each answers nothing, null or false when the value is not a map or the depth limit would be
    // passed; nothing is changed then.
    [[nodiscard]] std::span<const Entry> entries() const noexcept;
    [[nodiscard]] const PropertyList* find(std::string_view key) const noexcept;
    /// The string at `key`; null when there is none or it is of another kind.
    [[nodiscard]] const std::string* findString(std::string_view key) const noexcept;
    /// The boolean conversion of what is at `key`; false when there is none.
    [[nodiscard]] bool findFlag(std::string_view key) const noexcept;
    /// Replaces the value in place, or adds the entry at the end.
    bool set(std::string_view key, PropertyList value);
    /// Moves the value out and leaves the null marker in its place (the entry stays, in its place).
    [[nodiscard]] PropertyList take(std::string_view key);
    bool erase(std::string_view key);

    friend bool operator==(const PropertyList& left, const PropertyList& right) noexcept;

  private:
    struct ArrayStorage;
    struct MapStorage;
    struct StorageDeleter {
        void operator()(ArrayStorage* storage) const noexcept;
        void operator()(MapStorage* storage) const noexcept;
    };
    using ArrayPointer = std::unique_ptr<ArrayStorage, StorageDeleter>;
    using MapPointer = std::unique_ptr<MapStorage, StorageDeleter>;
    using Storage = std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, Date,
                                 std::shared_ptr<const Bytes>, std::string,
                                 std::shared_ptr<const std::string>, ArrayPointer, MapPointer>;

    static PropertyList arrayFor(std::size_t capacity);
    static Storage copyOf(const Storage& value);
    [[nodiscard]] const ArrayStorage* arrayStorage() const noexcept;
    [[nodiscard]] ArrayStorage* arrayStorage() noexcept;
    [[nodiscard]] const MapStorage* mapStorage() const noexcept;
    [[nodiscard]] MapStorage* mapStorage() noexcept;
    std::size_t tightenDepth() noexcept;
    [[nodiscard]] bool fitsInContainer() noexcept;

    Storage value_;
};

/// A key of a map, and its value.
struct PropertyList::Entry {
    std::string key;
    PropertyList value;
};

}  // namespace appsync
