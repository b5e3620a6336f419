#include "host/serve/DeviceView.h"

#include <algorithm>
#include <chrono>
#include <utility>

#include <nlohmann/json.hpp>

#include "device/values/DeviceError.h"
#include "host/console/JsonWriting.h"
#include "host/output/FailureText.h"
#include "host/output/JsonRecords.h"
#include "host/output/WhyAnswer.h"
#include "host/serve/http/PercentDecoding.h"

namespace appsync {
namespace {

using ViewJson = nlohmann::ordered_json;

// Stamps of a process are greater than those of the one before it.
std::uint64_t firstStamp() {
    const auto now = std::chrono::system_clock::now().time_since_epoch();
    return static_cast<std::uint64_t>(
        std::chrono::duration_cast<std::chrono::milliseconds>(now).count());
}

std::string_view stateOf(const ErrorRecord& error) {
    if (isDeviceError(error, DeviceErrorCode::Missing)) return "gone";
    for (const DeviceErrorCode code :
         {DeviceErrorCode::InUse, DeviceErrorCode::CannotUse, DeviceErrorCode::NoSpace}) {
        if (isDeviceError(error, code)) return "locked";
    }
    return "damaged";
}

bool hasNews(const ApplicationStatus& status) {
    return status.placeholder || status.coordinator || status.denial || status.awaitsRestoreData;
}

ViewJson waitOf(const std::string& identifier, const ApplicationStatus& status,
                const DeviceSettings& settings) {
    if (!hasNews(status)) return {};
    const WhyAnswer answer = explain(identifier, status, settings);
    if (!answer.waitsFor) return {};
    ViewJson wait = jsonOf(*answer.waitsFor);
    wait["sentence"] = answer.waitsFor->sentence;
    return wait;
}

std::string iconAddress(const std::string& key, const ApplicationRecord& record) {
    const std::string_view container = record.container;
    const std::string_view version = container.substr(container.rfind('/') + 1);
    return "/api/device/" + key + "/icon/" + percentEncoded(record.identifier) +
           "?v=" + percentEncoded(version);
}

std::string recordText(const std::string& key, const ApplicationRecord& record,
                       const ApplicationStatus& status, const ViewJson& wait) {
    ViewJson json = jsonOf(record);
    const bool isShown = record.isPlaceholder || !status.placeholder;
    json["icon"] = iconAddress(key, isShown ? record : *status.placeholder);
    json["progress"] = record.progress ? ViewJson(record.progress->fraction()) : ViewJson();
    json["running"] = status.isRunning;
    json["waitingFor"] = wait;
    json["lastError"] = status.lastFailure
                            ? ViewJson(failureText(record.identifier, status.lastFailure->error))
                            : ViewJson();
    return dumped(json);
}

std::string recordsText(const std::string& key, const std::string& identifier,
                        const ApplicationStatus& status, const DeviceSettings& settings) {
    const ViewJson wait = waitOf(identifier, status, settings);
    std::string text;
    if (status.installed) text = recordText(key, *status.installed, status, wait);
    if (!status.placeholder) return text;
    if (!text.empty()) text += ",";
    return text + recordText(key, *status.placeholder, status, wait);
}

std::string screenText(const DeviceReading& reading) {
    const auto stands = [&](const std::string& identifier) {
        const auto found = reading.moment.applications.find(identifier);
        return found != reading.moment.applications.end() &&
               (found->second.installed || found->second.placeholder);
    };
    ViewJson order = ViewJson::array();
    for (const std::string& each : reading.homeScreen) {
        if (stands(each)) order.push_back(each);
    }
    return dumped(order);
}

std::string coordinatorsText(const DeviceMoment& moment) {
    ViewJson list = ViewJson::array();
    for (const auto& [identifier, status] : moment.applications) {
        if (status.coordinator) list.push_back(jsonOf(*status.coordinator));
    }
    return dumped(list);
}

void put(ViewedText& place, std::string json, std::uint64_t stamp) {
    if (place.json == json) return;
    place = {std::move(json), stamp};
}

void count(ViewedApplications& shown, const ApplicationStatus& status) {
    if (status.installed) ++shown.installed;
    if (!status.placeholder) return;
    ++shown.placeholders;
    if (status.placeholder->progress) ++shown.installing;
}

void appendMember(std::string& text, std::string_view name, std::string_view json) {
    text += text.size() > 1 ? ",\"" : "\"";
    text.append(name).append("\":").append(json);
}

std::string applicationsText(const DeviceView& view, std::uint64_t since) {
    std::string text = "[";
    for (const auto& [identifier, each] : view.applications->texts) {
        if (each.changed <= since) continue;
        if (text.size() > 1) text += ",";
        text += each.json;
    }
    return text + "]";
}

std::string goneText(const DeviceView& view, std::uint64_t since) {
    ViewJson list = ViewJson::array();
    for (const auto& [identifier, stamp] : view.applications->gone) {
        if (stamp > since) list.push_back(identifier);
    }
    return dumped(list);
}

DeviceView emptyView() {
    DeviceView view;
    view.applications = std::make_shared<ViewedApplications>();
    view.screen.json = "[]";
    view.coordinators.json = "[]";
    view.session.json = "null";
    return view;
}

}  // namespace

std::shared_ptr<const DeviceView> lockedView(const DeviceView* last) {
    auto view = std::make_shared<DeviceView>(last != nullptr ? *last : emptyView());
    view->state = "locked";
    view->message = "somebody keeps the device's database to himself: it cannot be read";
    return view;
}

DeviceViewer::DeviceViewer(std::string key) : key_(std::move(key)) {
    auto first = std::make_shared<DeviceView>(emptyView());
    first->stamp = firstStamp();
    first->begun = first->stamp;
    last_ = std::move(first);
}

std::shared_ptr<const DeviceView> DeviceViewer::show(const Result<DeviceReading>& reading,
                                                     bool hasLog) {
    auto next = std::make_shared<DeviceView>(*last_);
    ++next->stamp;
    next->hasTimeline = reading && hasLog;
    if (reading) {
        showReading(*next, *reading);
    } else {
        showError(*next, reading.error());
    }
    if (next->state != last_->state || next->message != last_->message) {
        next->stateChanged = next->stamp;
    }
    const bool hasChanged =
        next->stateChanged == next->stamp || next->applicationsChanged == next->stamp ||
        next->coordinators.changed == next->stamp || next->session.changed == next->stamp;
    // What has no part in that, the free space for one, goes along with the next change.
    if (hasChanged || next->status != last_->status || next->hasTimeline != last_->hasTimeline)
        last_ = std::move(next);
    return last_;
}

std::shared_ptr<const DeviceView> DeviceViewer::showLogChanged() {
    auto next = std::make_shared<DeviceView>(*last_);
    next->logChanged = ++next->stamp;
    last_ = std::move(next);
    return last_;
}

std::shared_ptr<const DeviceView> DeviceViewer::showStateAgain() {
    auto next = std::make_shared<DeviceView>(*last_);
    next->stateChanged = ++next->stamp;
    last_ = std::move(next);
    return last_;
}

void DeviceViewer::showReading(DeviceView& next, const DeviceReading& reading) {
    session_.see(reading.moment);
    next.state = reading.moment.session.isUnderWay ? "syncing" : "idle";
    next.message.clear();
    showApplications(next, reading);
    put(next.screen, screenText(reading), next.stamp);
    if (next.screen.changed == next.stamp) next.applicationsChanged = next.stamp;
    put(next.coordinators, coordinatorsText(reading.moment), next.stamp);
    put(next.session, dumped(session_.json()), next.stamp);
    next.status = dumped(jsonOf(reading.overview));
}

void DeviceViewer::showError(DeviceView& next, const ErrorRecord& error) {
    next.state = stateOf(error);
    next.message = error.description();
    // What stands on a device that is only closed at the moment stands there still.
    if (next.state == "locked") return;
    showApplications(next, {});
    put(next.screen, "[]", next.stamp);
    put(next.coordinators, "[]", next.stamp);
    put(next.session, "null", next.stamp);
    next.status = "null";
}

void DeviceViewer::showApplications(DeviceView& next, const DeviceReading& reading) const {
    const ViewedApplications& former = *last_->applications;
    auto shown = std::make_shared<ViewedApplications>();
    shown->gone = former.gone;
    for (const auto& [identifier, status] : reading.moment.applications) {
        std::string text = recordsText(key_, identifier, status, reading.overview.settings);
        if (text.empty()) continue;  // nothing but a coordinator
        ViewedText& place = shown->texts[identifier];
        const auto before = former.texts.find(identifier);
        if (before != former.texts.end()) place = before->second;
        put(place, std::move(text), next.stamp);
        if (place.changed == next.stamp) next.applicationsChanged = next.stamp;
        shown->gone.erase(identifier);
        count(*shown, status);
        shown->icons[identifier] = status.placeholder ? *status.placeholder : *status.installed;
    }
    for (const auto& [identifier, text] : former.texts) {
        if (shown->texts.contains(identifier)) continue;
        shown->gone[identifier] = next.stamp;
        next.applicationsChanged = next.stamp;
    }
    next.applications = std::move(shown);
}

std::string viewText(const DeviceView& view, const std::string& name,
                     std::optional<std::uint64_t> asked) {
    const bool isPart = asked && *asked >= view.begun && *asked <= view.stamp;
    const std::uint64_t since = isPart ? *asked : 0;
    std::string text = "{";
    appendMember(text, "name", dumped(name));
    appendMember(text, "stamp", std::to_string(view.stamp));
    appendMember(text, "whole", isPart ? "false" : "true");
    appendMember(text, "state", dumped(view.state));
    appendMember(text, "message", dumped(view.message));
    appendMember(text, "applications", applicationsText(view, since));
    appendMember(text, "gone", goneText(view, since));
    if (!isPart || view.screen.changed > since) appendMember(text, "screen", view.screen.json);
    if (!isPart || view.coordinators.changed > since) {
        appendMember(text, "coordinators", view.coordinators.json);
    }
    appendMember(text, "session", view.session.json);
    appendMember(text, "timeline",
                 view.hasTimeline ? dumped("/api/device/" + percentEncoded(name) + "/timeline.svg")
                                  : std::string("null"));
    appendMember(text, "status", view.status);
    return text + "}";
}

ViewJson changesSince(const DeviceView& view, std::uint64_t stamp) {
    ViewJson changes = ViewJson::array();
    const auto add = [&](const char* name, std::uint64_t changed) {
        if (stamp == 0 || changed > stamp) changes.push_back(name);
    };
    add("state", view.stateChanged);
    add("applications", view.applicationsChanged);
    add("log", view.logChanged);
    add("session", view.session.changed);
    add("coordinators", view.coordinators.changed);
    return changes;
}

}  // namespace appsync
