#include "client/ItemMap.h"

#include <utility>

namespace appsync {

ItemMap::ItemMap(std::size_t capacity) {
    slots_.reserve(capacity);
    places_.reserve(capacity);
}

bool ItemMap::add(const std::string& identifier, PropertyList item) {
    const auto [place, isNew] = places_.try_emplace(identifier, slots_.size());
    if (isNew) slots_.push_back({&place->first, std::move(item)});
    return isNew;
}

bool ItemMap::contains(const std::string& identifier) const { return places_.contains(identifier); }

std::optional<PropertyList> ItemMap::take(const std::string& identifier) {
    const auto place = places_.find(identifier);
    if (place == places_.end()) return std::nullopt;
    Slot& slot = slots_[place->second];
    slot.identifier = nullptr;
    places_.erase(place);
    return std::exchange(slot.item, PropertyList());
}

void ItemMap::forEach(const Visitor& visitor) const {
    for (const Slot& slot : slots_) {
        if (slot.identifier != nullptr) visitor(*slot.identifier, slot.item);
    }
}

PropertyList ItemMap::description() const {
    PropertyList map = PropertyList::map(places_.size());
    for (const Slot& slot : slots_) {
        if (slot.identifier != nullptr) map.set(*slot.identifier, slot.item);
    }
    return map;
}

}  // namespace appsync
