#pragma once

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/PropertyList.h"

namespace appsync {

/// Items by application identifier, in the order in which they came. No call's cost grows with the
/// number of items, but for `forEach` and `description`, which visit each. One thread at a time.
class ItemMap {
  public:
    using Visitor = std::function<void(const std::string& identifier, const PropertyList& item)>;

    explicit ItemMap(std::size_t capacity = 0);

    /// Adds the item at the end. False, and nothing is changed, when there is one already.
    bool add(const std::string& identifier, PropertyList item);
    [[nodiscard]] bool contains(const std::string& identifier) const;
    /// Removes the item and hands it over; nothing when there is none.
    std::optional<PropertyList> take(const std::string& identifier);
    /// Shows every item, in order.
    void forEach(const Visitor& visitor) const;

    [[nodiscard]] std::size_t size() const { return places_.size(); }
    /// The map as a value, for messages.
    [[nodiscard]] PropertyList description() const;

  private:
    struct Slot {
        const std::string* identifier;  // the key in places_; null once the item was taken
        PropertyList item;
    };

    std::vector<Slot> slots_;
    std::unordered_map<std::string, std::size_t> places_;  // where each item stands in slots_
};

}  // namespace appsync
