#include "host/output/JsonSync.h"

#include <nlohmann/json.hpp>

#include "host/console/JsonWriting.h"
#include "host/console/Text.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;

Json failures(const std::vector<SyncFailure>& failed) {
    Json list = Json::array();
    for (const SyncFailure& each : failed) {
        list.push_back({{"identifier", each.identifier}, {"error", each.error}});
    }
    return list;
}

Json skips(const std::vector<PlannedSkip>& skipped) {
    Json list = Json::array();
    for (const PlannedSkip& each : skipped) {
        list.push_back({{"identifier", each.identifier}, {"why", each.why}});
    }
    return list;
}

Json identifiers(const std::vector<PlannedInstall>& installs) {
    Json list = Json::array();
    for (const PlannedInstall& each : installs) list.push_back(each.identifier);
    return list;
}

Json versionOrNull(const std::string& version) { return version.empty() ? Json() : Json(version); }

Json updates(const std::vector<PlannedInstall>& planned) {
    Json list = Json::array();
    for (const PlannedInstall& each : planned) {
        list.push_back({{"identifier", each.identifier},
                        {"oldVersion", versionOrNull(each.oldVersion)},
                        {"newVersion", versionOrNull(each.newVersion)},
                        {"downgrade", each.isDowngrade()}});
    }
    return list;
}

Json packageObjects(const SyncPlan& plan) {
    Json list = Json::array();
    for (const auto* installs : {&plan.install, &plan.update}) {
        for (const PlannedInstall& each : *installs) {
            const bool travels = !each.hasArrived && !each.file.empty();
            list.push_back({{"identifier", each.identifier},
                            {"version", versionOrNull(each.newVersion)},
                            {"file", travels ? Json(each.file) : Json()},
                            {"bytes", each.hasArrived ? 0 : each.bytes},
                            {"unpackedBytes", each.unpackedBytes}});
        }
    }
    return list;
}

}  // namespace

std::string jsonText(const SyncEvent& event) {
    Json object = {{"event", nameOf(event.kind)},
                   {"phase", nameOf(event.phase)},
                   {"identifier", event.identifier},
                   {"done", event.done},
                   {"total", event.total},
                   {"state", nameOf(event.state)},
                   {"nextTry", nullptr}};
    if (event.phase == SyncPhase::Prepare) object["identifier"] = nullptr;  // it is of all of them
    if (event.nextTry) object["nextTry"] = formatTime(*event.nextTry);
    if (event.state == SyncState::Failed) object["error"] = event.text;
    if (event.state == SyncState::Waiting) {
        object["waitsFor"] = {{"what", "termination"},
                              {"who", event.identifier},
                              {"nextTry", object["nextTry"]},
                              {"promise", nullptr}};
    }
    return dumped(object);
}

std::string jsonText(const SyncSummary& summary, JsonLayout layout) {
    Json object;
    if (layout == JsonLayout::EventLine) object["event"] = "summary";
    object["requested"] = summary.requested;
    object["installed"] = summary.installed;
    object["updated"] = summary.updated;
    object["removed"] = summary.removed;
    object["failed"] = failures(summary.failed);
    object["skipped"] = skips(summary.skipped);
    object["bytes"] = summary.bytes;
    object["seconds"] = summary.seconds;
    return layout == JsonLayout::EventLine ? dumped(object) : indented(object);
}

std::string jsonText(const SyncPlan& plan, const SpaceCheck& space, JsonLayout layout) {
    Json object;
    if (layout == JsonLayout::EventLine) object["event"] = "plan";
    object["install"] = identifiers(plan.install);
    object["update"] = updates(plan.update);
    object["remove"] = plan.remove;
    object["packages"] = packageObjects(plan);
    object["skipped"] = skips(plan.skipped);
    object["failed"] = failures(plan.failed);
    object["notes"] = plan.notes;
    object["bytes"] = plan.bytes();
    object["needed"] = space.needed;
    object["free"] = space.free;
    object["reclaimed"] = space.reclaimed;
    object["missing"] = space.missing();
    object["fits"] = space.fits();
    return layout == JsonLayout::EventLine ? dumped(object) : indented(object);
}

std::string stagedJsonText(const SyncPlan& plan, std::string_view area, bool hasReplaced) {
    return indented({{"area", area},
                     {"install", identifiers(plan.install)},
                     {"update", updates(plan.update)},
                     {"remove", plan.remove},
                     {"skipped", skips(plan.skipped)},
                     {"failed", failures(plan.failed)},
                     {"notes", plan.notes},
                     {"replaced", hasReplaced}});
}

}  // namespace appsync
