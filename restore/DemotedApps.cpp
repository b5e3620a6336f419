#include "restore/DemotedApps.h"

#include <string_view>

#include "restore/RestoredApp.h"

namespace appsync {

namespace {

constexpr std::string_view kAutomaticKey = "AutomaticDowngrades";
constexpr std::string_view kIntentionalKey = "IntentionalDowngrades";

/// The strings in the array at `key`; none when something else stands there.
std::unordered_set<std::string> stringsAt(const PropertyList& list, std::string_view key) {
    std::unordered_set<std::string> strings;
    const PropertyList* array = list.find(key);
    if (array == nullptr) return strings;
    for (const PropertyList& element : array->elements()) {
        if (const std::string* text = element.asString()) strings.insert(*text);
    }
    return strings;
}

}  // namespace

DemotedApps::DemotedApps(const PropertyList& list)
    : automatically_(stringsAt(list, kAutomaticKey)),
      intentionally_(stringsAt(list, kIntentionalKey)) {}

std::uint64_t DemotedApps::statusOf(const std::string& identifier) const {
    if (automatically_.contains(identifier)) return kAutomaticallyDemoted;
    if (intentionally_.contains(identifier)) return kIntentionallyDemoted;
    return kNotDemoted;
}

}  // namespace appsync
