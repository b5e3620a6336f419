#include "host/output/JsonRecords.h"

#include <cmath>
#include <utility>

#include <nlohmann/json.hpp>

#include "device/package/PackageReader.h"
#include "host/console/JsonWriting.h"
#include "host/console/Text.h"
#include "host/output/PropertyListOutline.h"
#include "host/output/WhyAnswer.h"
#include "host/session/Inventory.h"
#include "platform/AppRegistry.h"
#include "platform/PropertyList.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;

template <typename Value>
Json orNull(const std::optional<Value>& value) {
    return value ? Json(*value) : Json();
}

Json jsonOf(const KeptVersion& kept) {
    return {{"version", orNull(kept.version)}, {"bytes", kept.bytes}};
}

Json jsonOf(const PromiseRecord& record) {
    return {{"name", record.name}, {"complete", record.complete}, {"percent", record.percent}};
}

template <typename Record>
std::string listText(const std::vector<Record>& records) {
    Json list = Json::array();
    for (const Record& record : records) list.push_back(jsonOf(record));
    return indented(list);
}

Json jsonOf(const PersonIdentifier& person) {
    return std::visit([](auto number) { return Json(number); }, person);
}

Json jsonOf(const SyncAccountInfo& account) {
    return {{"accountID", account.accountID},
            {"personID", account.personID ? jsonOf(*account.personID) : Json()},
            {"alternatePersonID", orNull(account.alternatePersonID)}};
}

Json jsonOf(const PackageInfo& info) {
    return {{"identifier", info.identifier},
            {"version", info.version},
            {"name", info.displayName},
            {"executable", info.executable},
            {"iconFile", info.iconFile},
            {"bundle", info.bundleDirectoryName},
            {"entries", info.entryCount},
            {"bytes", info.packedBytes},
            {"unpackedBytes", info.unpackedBytes},
            {"storeMetadata", info.hasStoreMetadata}};
}

Json jsonOf(const PropertyList& value);

Json jsonOfMap(const PropertyList& map) {
    Json object = Json::object();
    for (const PropertyList::Entry& entry : map.entries()) object[entry.key] = jsonOf(entry.value);
    return object;
}

Json jsonOfArray(const PropertyList& array) {
    Json list = Json::array();
    for (const PropertyList& element : array.elements()) list.push_back(jsonOf(element));
    return list;
}

Json jsonOf(const PropertyList& value) {
    switch (value.kind()) {
        case PropertyList::Kind::Null:
            return {};
        case PropertyList::Kind::Boolean:
            return *value.asBoolean();
        case PropertyList::Kind::Integer:
            return *value.asInteger();
        case PropertyList::Kind::Unsigned:
            return *value.asUnsigned();
        case PropertyList::Kind::Real:
            return *value.asReal();
        case PropertyList::Kind::Date:
            return {{"date", dateText(*value.asDate())}};
        case PropertyList::Kind::Data:
            return {{"data", base64Text(*value.asData())}};
        case PropertyList::Kind::String:
            return *value.asString();
        case PropertyList::Kind::Array:
            return jsonOfArray(value);
        case PropertyList::Kind::Map:
            return jsonOfMap(value);
    }
    return {};
}

}  // namespace

nlohmann::ordered_json jsonOf(const ApplicationRecord& record) {
    return {{"identifier", record.identifier},
            {"version", orNull(record.version)},
            {"name", orNull(record.name)},
            {"state", record.isPlaceholder ? "placeholder" : "installed"},
            {"placeholder", record.isPlaceholder ? Json(placeholderKind(record)) : Json()},
            {"type", record.type},
            {"installType", record.installType},
            {"container", record.container},
            {"bytes", record.bytes},
            {"kept", record.kept ? jsonOf(*record.kept) : Json()}};
}

nlohmann::ordered_json jsonOf(const HistoryRecord& record) {
    const bool isScenario = record.kind == HistoryRecord::Kind::Scenario;
    Json object = {{"time", formatTime(record.time)}, {"kind", isScenario ? "scenario" : "step"}};
    if (isScenario) {
        object["scenario"] = record.scenario;
    } else {
        object["step"] = record.step;
    }
    object["party"] = isScenario ? Json() : Json(record.party);
    object["phase"] = isScenario ? Json() : Json(record.phase);
    object["success"] = record.success;
    object["identifier"] = record.identifier;
    object["description"] = record.description;
    return object;
}

nlohmann::ordered_json jsonOf(const CoordinatorRecord& record) {
    Json promises = Json::array();
    for (const PromiseRecord& promise : record.promises) promises.push_back(jsonOf(promise));
    return {{"identifier", record.identifier},
            {"kind", record.kind},
            {"client", record.client},
            {"promises", std::move(promises)},
            {"placeholder", record.placeholderStands},
            {"state", coordinatorState(record)}};
}

nlohmann::ordered_json jsonOf(const AwaitedThing& thing) {
    return {{"what", thing.what},
            {"who", thing.who},
            {"nextTry", thing.nextTry ? Json(formatTime(*thing.nextTry)) : Json()},
            {"promise", orNull(thing.promise)}};
}

nlohmann::ordered_json jsonOf(const WhyAnswer& answer) {
    Json waitsFor;
    if (answer.waitsFor) waitsFor = jsonOf(*answer.waitsFor);
    return {{"identifier", answer.identifier},
            {"state", answer.state},
            {"waitsFor", std::move(waitsFor)},
            {"lastError", orNull(answer.lastError)}};
}

std::string_view placeholderKind(const ApplicationRecord& record) {
    switch (record.installType) {
        case kInstallTypeDowngrade:
        case kInstallTypeIntentionalDowngrade:
            return "offloaded";
        case kInstallTypeRestore:
            return "restored";
        default:
            return "arriving";
    }
}

std::string coordinatorState(const CoordinatorRecord& record) {
    return record.isComplete ? "everything is there" : record.waitsFor;
}

std::string jsonText(const std::vector<ApplicationRecord>& records) { return listText(records); }

std::string jsonText(const std::vector<HistoryRecord>& records) { return listText(records); }

std::string jsonText(const std::vector<CoordinatorRecord>& records) { return listText(records); }

std::string jsonText(const Inventory& inventory) {
    Json accounts = Json::array();
    for (const SyncAccountInfo& account : inventory.accounts) accounts.push_back(jsonOf(account));
    return indented({{"deleted", inventory.deleted},
                     {"count", inventory.count},
                     {"physicalSize", inventory.physicalSize},
                     {"purgeableSize", inventory.purgeableSize},
                     {"accountIDs", inventory.accountIDs},
                     {"accounts", std::move(accounts)}});
}

std::string jsonText(const WhyAnswer& answer) { return indented(jsonOf(answer)); }

std::string jsonText(const PackageInfo& info) { return indented(jsonOf(info)); }

std::string jsonText(const PackageInfo& info, bool hasReplaced) {
    Json object = jsonOf(info);
    object["replaced"] = hasReplaced;
    return indented(object);
}

std::string jsonText(const PropertyList& value) { return indented(jsonOf(value)); }

}  // namespace appsync
