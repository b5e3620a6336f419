#include "platform/PropertyList.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <type_traits>

#include "platform/PropertyListKeyIndex.h"

namespace appsync {

namespace {

// Comparing so many keys one after the other costs less than hashing one.
constexpr std::size_t kLinearEntries = 16;

char lowered(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

bool equalIgnoringCase(std::string_view left, std::string_view right) {
    return std::equal(left.begin(), left.end(), right.begin(), right.end(),
                      [](char a, char b) { return lowered(a) == lowered(b); });
}

std::optional<bool> booleanOfText(std::string_view text) {
    constexpr std::array<std::string_view, 5> yes = {"yes", "true", "1", "y", "t"};
    constexpr std::array<std::string_view, 5> no = {"no", "false", "0", "n", "f"};
    const auto reads = [text](std::string_view word) { return equalIgnoringCase(text, word); };
    if (std::any_of(yes.begin(), yes.end(), reads)) return true;
    if (std::any_of(no.begin(), no.end(), reads)) return false;
    return std::nullopt;
}

bool sameReal(double left, double right) {
    return left == right || (std::isnan(left) && std::isnan(right));
}

using Entries = std::span<const PropertyList::Entry>;

std::optional<std::size_t> linearFind(Entries entries, std::string_view key) {
    for (std::size_t i = 0; i < entries.size(); ++i) {
        if (entries[i].key == key) return i;
    }
    return std::nullopt;
}

std::optional<std::size_t> indexedFind(const PropertyListKeyIndex& index, std::uint32_t hash,
                                       Entries entries, std::string_view key) {
    const auto keyAt = [entries](std::size_t i) -> std::string_view { return entries[i].key; };
    return index.find(hash, key, keyAt);
}

/// A bit that equal keys have in common. Few keys share one with another.
std::uint64_t markOf(std::string_view key) {
    if (key.empty()) return 1;
    const auto at = [key](std::size_t i) -> std::size_t {
        return static_cast<unsigned char>(key[i]);
    };
    return std::uint64_t{1} << ((key.size() * 7 + at(0) * 3 + at(key.size() - 1)) & 63U);
}

std::optional<std::size_t> repeatedAmongFew(Entries entries) {
    std::uint64_t marks = 0;
    for (std::size_t i = 0; i < entries.size(); ++i) {
        const std::string& key = entries[i].key;
        const std::uint64_t mark = markOf(key);
        if ((marks & mark) != 0 && linearFind(entries.first(i), key)) return i;
        marks |= mark;
    }
    return std::nullopt;
}

/// The first entry whose key an earlier one has too. Leaves an index of all entries, if there are
/// enough of them to have one and none is repeated.
std::optional<std::size_t> repeatedKey(Entries entries, PropertyListKeyIndex& index) {
    if (entries.size() <= kLinearEntries) return repeatedAmongFew(entries);
    for (std::size_t i = 0; i < entries.size(); ++i) {
        const std::string& key = entries[i].key;
        const std::uint32_t hash = PropertyListKeyIndex::hashOf(key);
        if (indexedFind(index, hash, entries, key)) return i;
        index.add(hash, i);
    }
    return std::nullopt;
}

}  // namespace

struct PropertyList::ArrayStorage {
    std::vector<PropertyList> elements;
    std::size_t innerDepth = 0;  // at least that of the deepest element
};

struct PropertyList::MapStorage {
    [[nodiscard]] std::optional<std::size_t> positionOf(std::string_view key) const noexcept {
        if (index.empty()) return linearFind(entries, key);
        return indexedFind(index, PropertyListKeyIndex::hashOf(key), entries, key);
    }

    void add(std::string_view key, PropertyList&& value) {
        if (index.empty() && entries.size() == kLinearEntries) indexAllEntries();
        const bool isIndexed = !index.empty();
        if (isIndexed) index.makeRoom();
        entries.push_back({std::string(key), std::move(value)});
        if (isIndexed) index.add(PropertyListKeyIndex::hashOf(key), entries.size() - 1);
    }

    void indexAllEntries() {
        PropertyListKeyIndex all;
        for (std::size_t i = 0; i < entries.size(); ++i) {
            all.add(PropertyListKeyIndex::hashOf(entries[i].key), i);
        }
        index = std::move(all);
    }

    void erase(std::size_t position) {
        if (!index.empty()) index.erase(position);
        entries.erase(entries.begin() + static_cast<std::ptrdiff_t>(position));
    }

    std::vector<Entry> entries;
    PropertyListKeyIndex index;  // of all entries, or empty as long as there are few
    std::size_t innerDepth = 0;  // at least that of the deepest value
};

void PropertyList::StorageDeleter::operator()(ArrayStorage* storage) const noexcept {
    delete storage;
}
void PropertyList::StorageDeleter::operator()(MapStorage* storage) const noexcept {
    delete storage;
}

PropertyList::PropertyList(const PropertyList& other) : value_(copyOf(other.value_)) {}
PropertyList& PropertyList::operator=(const PropertyList& other) {
    if (this != &other) *this = PropertyList(other);
    return *this;
}
PropertyList::PropertyList(Bytes value)
    : value_(std::shared_ptr<const Bytes>(std::make_shared<Bytes>(std::move(value)))) {}

PropertyList PropertyList::shared(std::shared_ptr<const std::string> text) noexcept {
    PropertyList result;
    result.value_ = Storage(std::move(text));
    return result;
}

PropertyList PropertyList::shared(std::shared_ptr<const Bytes> data) noexcept {
    PropertyList result;
    result.value_ = Storage(std::move(data));
    return result;
}

PropertyList PropertyList::array() { return arrayFor(0); }

PropertyList PropertyList::arrayFor(std::size_t capacity) {
    ArrayPointer storage(new ArrayStorage());
    storage->elements.reserve(capacity);
    PropertyList result;
    result.value_ = std::move(storage);
    return result;
}

PropertyList PropertyList::array(std::initializer_list<PropertyList> elements) {
    PropertyList result = array(elements.size());
    for (const PropertyList& element : elements) result.append(element);
    return result;
}

PropertyList PropertyList::strings(std::span<const std::string> elements) {
    PropertyList result = array(elements.size());
    for (const std::string& element : elements) result.append(element);
    return result;
}

PropertyList PropertyList::map(std::size_t capacity) {
    MapPointer storage(new MapStorage());
    storage->entries.reserve(capacity);
    PropertyList result;
    result.value_ = std::move(storage);
    return result;
}

PropertyList PropertyList::map(
    std::initializer_list<std::pair<std::string_view, PropertyList>> entries) {
    PropertyList result = map(entries.size());
    for (const auto& [key, value] : entries) result.set(key, value);
    return result;
}

bool PropertyList::becomeArray(std::vector<PropertyList>& elements) {
    std::size_t innerDepth = 0;
    for (PropertyList& element : elements) {
        if (!element.fitsInContainer()) return false;
        innerDepth = std::max(innerDepth, element.depth());
    }
    value_ = ArrayPointer(new ArrayStorage{std::move(elements), innerDepth});
    return true;
}

bool PropertyList::becomeMap(std::vector<Entry>& entries) {
    std::size_t innerDepth = 0;
    for (Entry& entry : entries) {
        if (!entry.value.fitsInContainer()) return false;
        innerDepth = std::max(innerDepth, entry.value.depth());
    }
    PropertyListKeyIndex index;
    if (repeatedKey(entries, index)) return false;
    value_ = MapPointer(new MapStorage{std::move(entries), std::move(index), innerDepth});
    return true;
}

std::optional<std::size_t> PropertyList::findRepeatedKey(std::span<const Entry> entries) {
    PropertyListKeyIndex index;
    return repeatedKey(entries, index);
}

PropertyList::Storage PropertyList::copyOf(const Storage& value) {
    return std::visit(
        [](const auto& held) -> Storage {
            using Held = std::decay_t<decltype(held)>;
            if constexpr (std::is_same_v<Held, ArrayPointer> || std::is_same_v<Held, MapPointer>) {
                return Held(new typename Held::element_type(*held));
            } else {
                return held;
            }
        },
        value);
}

PropertyList::Kind PropertyList::kind() const noexcept {
    constexpr std::array<Kind, std::variant_size_v<Storage>> kinds = {
        Kind::Null, Kind::Boolean, Kind::Integer, Kind::Unsigned, Kind::Real, Kind::Date,
        Kind::Data, Kind::String,  Kind::String,  Kind::Array,    Kind::Map};
    return kinds[value_.index()];
}

std::optional<bool> PropertyList::asBoolean() const noexcept {
    const bool* held = std::get_if<bool>(&value_);
    return held != nullptr ? std::optional(*held) : std::nullopt;
}

std::optional<std::int64_t> PropertyList::asInteger() const noexcept {
    if (const auto* held = std::get_if<std::int64_t>(&value_)) return *held;
    const auto* held = std::get_if<std::uint64_t>(&value_);
    if (held == nullptr || !std::in_range<std::int64_t>(*held)) return std::nullopt;
    return static_cast<std::int64_t>(*held);
}

std::optional<std::uint64_t> PropertyList::asUnsigned() const noexcept {
    if (const auto* held = std::get_if<std::uint64_t>(&value_)) return *held;
    const auto* held = std::get_if<std::int64_t>(&value_);
    if (held == nullptr || *held < 0) return std::nullopt;
    return static_cast<std::uint64_t>(*held);
}

std::optional<double> PropertyList::asReal() const noexcept {
    const double* held = std::get_if<double>(&value_);
    return held != nullptr ? std::optional(*held) : std::nullopt;
}

std::optional<PropertyList::Date> PropertyList::asDate() const noexcept {
    const Date* held = std::get_if<Date>(&value_);
    return held != nullptr ? std::optional(*held) : std::nullopt;
}

const Bytes* PropertyList::asData() const noexcept {
    const auto* held = std::get_if<std::shared_ptr<const Bytes>>(&value_);
    return held != nullptr ? held->get() : nullptr;
}

const std::string* PropertyList::asString() const noexcept {
    if (const auto* held = std::get_if<std::string>(&value_)) return held;
    const auto* held = std::get_if<std::shared_ptr<const std::string>>(&value_);
    return held != nullptr ? held->get() : nullptr;
}

std::optional<bool> PropertyList::booleanConversion() const noexcept {
    if (const auto value = asBoolean()) return value;
    if (const auto value = asInteger()) return *value != 0;
    if (const auto value = asUnsigned()) return *value != 0;
    if (const auto value = asReal()) return *value != 0;
    if (const std::string* text = asString()) return booleanOfText(*text);
    return std::nullopt;
}

const PropertyList::ArrayStorage* PropertyList::arrayStorage() const noexcept {
    const auto* held = std::get_if<ArrayPointer>(&value_);
    return held != nullptr ? held->get() : nullptr;
}

PropertyList::ArrayStorage* PropertyList::arrayStorage() noexcept {
    const auto* held = std::get_if<ArrayPointer>(&value_);
    return held != nullptr ? held->get() : nullptr;
}

const PropertyList::MapStorage* PropertyList::mapStorage() const noexcept {
    const auto* held = std::get_if<MapPointer>(&value_);
    return held != nullptr ? held->get() : nullptr;
}

PropertyList::MapStorage* PropertyList::mapStorage() noexcept {
    const auto* held = std::get_if<MapPointer>(&value_);
    return held != nullptr ? held->get() : nullptr;
}

std::size_t PropertyList::size() const noexcept { return elements().size() + entries().size(); }

std::size_t PropertyList::depth() const noexcept {
    if (const ArrayStorage* array = arrayStorage()) return array->innerDepth + 1;
    if (const MapStorage* map = mapStorage()) return map->innerDepth + 1;
    return 0;
}

std::size_t PropertyList::tightenDepth() noexcept {
    std::size_t inner = 0;
    if (ArrayStorage* array = arrayStorage()) {
        for (auto& element : array->elements) inner = std::max(inner, element.tightenDepth());
        array->innerDepth = inner;
    }
    if (MapStorage* map = mapStorage()) {
        for (auto& entry : map->entries) inner = std::max(inner, entry.value.tightenDepth());
        map->innerDepth = inner;
    }
    return depth();
}

bool PropertyList::fitsInContainer() noexcept {
    return depth() < kMaximumDepth || tightenDepth() < kMaximumDepth;
}

std::span<const PropertyList> PropertyList::elements() const noexcept {
    const ArrayStorage* array = arrayStorage();
    return array != nullptr ? std::span(array->elements) : std::span<const PropertyList>();
}

const PropertyList* PropertyList::at(std::size_t index) const noexcept {
    const auto all = elements();
    return index < all.size() ? &all[index] : nullptr;
}

bool PropertyList::append(PropertyList element) {
    ArrayStorage* array = arrayStorage();
    if (array == nullptr || !element.fitsInContainer()) return false;
    array->innerDepth = std::max(array->innerDepth, element.depth());
    array->elements.push_back(std::move(element));
    return true;
}

bool PropertyList::set(std::size_t index, PropertyList element) {
    ArrayStorage* array = arrayStorage();
    if (array == nullptr || index >= array->elements.size()) return false;
    if (!element.fitsInContainer()) return false;
    array->innerDepth = std::max(array->innerDepth, element.depth());
    array->elements[index] = std::move(element);
    return true;
}

PropertyList PropertyList::take(std::size_t index) {
    ArrayStorage* array = arrayStorage();
    if (array == nullptr || index >= array->elements.size()) return {};
    return std::move(array->elements[index]);
}

std::span<const PropertyList::Entry> PropertyList::entries() const noexcept {
    const MapStorage* map = mapStorage();
    return map != nullptr ? std::span(map->entries) : std::span<const Entry>();
}

const PropertyList* PropertyList::find(std::string_view key) const noexcept {
    const MapStorage* map = mapStorage();
    if (map == nullptr) return nullptr;
    const auto position = map->positionOf(key);
    return position ? &map->entries[*position].value : nullptr;
}

const std::string* PropertyList::findString(std::string_view key) const noexcept {
    const PropertyList* value = find(key);
    return value != nullptr ? value->asString() : nullptr;
}

bool PropertyList::findFlag(std::string_view key) const noexcept {
    const PropertyList* value = find(key);
    return value != nullptr && value->booleanConversion().value_or(false);
}

bool PropertyList::set(std::string_view key, PropertyList value) {
    MapStorage* map = mapStorage();
    if (map == nullptr || !value.fitsInContainer()) return false;
    const auto position = map->positionOf(key);
    if (!position && map->entries.size() >= PropertyListKeyIndex::kMaximumSize) return false;
    map->innerDepth = std::max(map->innerDepth, value.depth());
    if (position) {
        map->entries[*position].value = std::move(value);
    } else {
        map->add(key, std::move(value));
    }
    return true;
}

PropertyList PropertyList::take(std::string_view key) {
    MapStorage* map = mapStorage();
    const auto position = map != nullptr ? map->positionOf(key) : std::nullopt;
    if (!position) return {};
    return std::move(map->entries[*position].value);
}

bool PropertyList::erase(std::string_view key) {
    MapStorage* map = mapStorage();
    const auto position = map != nullptr ? map->positionOf(key) : std::nullopt;
    if (!position) return false;
    map->erase(*position);
    return true;
}

namespace {

bool equalEntries(const PropertyList& left, const PropertyList& right) {
    if (left.size() != right.size()) return false;
    const auto leftEntries = left.entries();
    const auto rightEntries = right.entries();
    for (std::size_t i = 0; i < leftEntries.size(); ++i) {
        const auto& [key, value] = leftEntries[i];
        const bool sameOrder = rightEntries[i].key == key;
        const PropertyList* other = sameOrder ? &rightEntries[i].value : right.find(key);
        if (other == nullptr || !(*other == value)) return false;
    }
    return true;
}

bool isInteger(const PropertyList& value) {
    return value.kind() == PropertyList::Kind::Integer ||
           value.kind() == PropertyList::Kind::Unsigned;
}

}  // namespace

bool operator==(const PropertyList& left, const PropertyList& right) noexcept {
    if (isInteger(left) && isInteger(right)) {
        return left.asInteger() == right.asInteger() && left.asUnsigned() == right.asUnsigned();
    }
    if (left.kind() != right.kind()) return false;
    switch (left.kind()) {
        case PropertyList::Kind::Boolean:
            return left.asBoolean() == right.asBoolean();
        case PropertyList::Kind::Real:
            return sameReal(*left.asReal(), *right.asReal());
        case PropertyList::Kind::Date:
            return sameReal(left.asDate()->secondsSince2001, right.asDate()->secondsSince2001);
        case PropertyList::Kind::Data:
            return *left.asData() == *right.asData();
        case PropertyList::Kind::String:
            return *left.asString() == *right.asString();
        case PropertyList::Kind::Array:
            return std::ranges::equal(left.elements(), right.elements());
        case PropertyList::Kind::Map:
            return equalEntries(left, right);
        case PropertyList::Kind::Null:
        case PropertyList::Kind::Integer:  // compared above
        case PropertyList::Kind::Unsigned:
            break;
    }
    return true;
}

}  // namespace appsync
