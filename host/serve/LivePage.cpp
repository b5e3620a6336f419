#include "host/serve/LivePage.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cstdint>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "device/values/DevicePaths.h"
#include "device/values/PackageIdentifier.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/output/JsonRecords.h"
#include "host/output/WhyAnswer.h"
#include "host/serve/ChangeEvents.h"
#include "host/serve/DeviceView.h"
#include "host/serve/LogPage.h"
#include "host/serve/PageFiles.h"
#include "host/serve/ServedDevice.h"
#include "host/timeline/TimelineOfDevice.h"
#include "host/timeline/TimelineSvg.h"

namespace appsync {
namespace {

using PageJson = nlohmann::ordered_json;
using PageClock = std::chrono::steady_clock;

constexpr std::chrono::milliseconds kLongestView{2000};
constexpr std::size_t kMostLogLines = 1000;
constexpr std::size_t kMostHistory = 5000;

HttpAnswer nothingHere() { return refusal(404, "there is nothing under this address"); }

HttpAnswer fileAnswer(std::string_view name) {
    for (const PageFile& each : pageFiles()) {
        if (each.name == name) {
            return {.type = std::string(each.type), .body = std::string(each.text)};
        }
    }
    return nothingHere();
}

std::optional<std::uint64_t> countIn(const std::string& text) {
    std::uint64_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
    return number;
}

// The query's value; nothing where it is not given, or empty.
std::optional<std::string> given(const HttpRequest& request, const char* name) {
    const auto found = request.query.find(name);
    if (found == request.query.end() || found->second.empty()) return std::nullopt;
    return found->second;
}

PageJson cardOf(const ServedDevice& device, const DeviceView& view) {
    return {{"name", device.name()},
            {"path", device.path()},
            {"state", view.state},
            {"message", view.message},
            {"applications", view.applications->installed},
            {"installing", view.applications->installing},
            {"placeholders", view.applications->placeholders},
            {"session", PageJson::parse(view.session.json)}};
}

HttpAnswer whyAnswer(Device& device, const std::string& identifier) {
    const Result<WhyAnswer> answer = whyOf(device, identifier);
    if (!answer) {
        const bool isUnknown = answer.error().domain == kCommandErrorDomain &&
                               exitStatusOf(answer.error()) == kExitSomethingFailed;
        return refusal(isUnknown ? 404 : 503, answer.error().description());
    }
    PageJson json = jsonOf(*answer);
    json["text"] = whyText(*answer);
    return {.body = dumped(json)};
}

// The last of what has happened.
HttpAnswer historyAnswer(Device& device, const std::optional<std::string>& identifier) {
    const Result<std::vector<HistoryRecord>> records =
        identifier ? device.history() : device.history(kMostHistory);
    if (!records) return refusal(503, records.error().description());
    PageJson list = PageJson::array();
    for (const HistoryRecord& each : *records) {
        if (!identifier || each.identifier == *identifier) list.push_back(jsonOf(each));
    }
    return {.body = dumped(list)};
}

// Of the last session, or the one under way.
HttpAnswer timelineAnswer(Device& device, const std::string& name) {
    const Result<Timeline> timeline =
        timelineOfDevice(device, name, {.now = std::chrono::system_clock::now()});
    if (!timeline) return refusal(503, timeline.error().description());
    return {.type = "image/svg+xml",
            .body = timelineSvg(*timeline),
            .policy = "default-src 'none'; style-src 'unsafe-inline'; sandbox"};
}

std::optional<LogQuestion> logQuestion(const HttpRequest& request) {
    LogQuestion question;
    if (const std::optional<std::string> level = given(request, "level")) {
        question.filter.level = levelNamed(*level);
        if (!question.filter.level) return std::nullopt;
    }
    if (const std::optional<std::string> category = given(request, "category")) {
        const std::optional<std::uint64_t> number = countIn(*category);
        if (!number) return std::nullopt;
        question.filter.category = static_cast<std::int64_t>(*number);
    }
    if (const std::optional<std::string> limit = given(request, "limit")) {
        const std::optional<std::uint64_t> number = countIn(*limit);
        if (!number || *number == 0) return std::nullopt;
        question.most = std::min<std::uint64_t>(*number, kMostLogLines);
    }
    question.filter.application = given(request, "app");
    question.filter.text = given(request, "text");
    question.after = given(request, "after");
    return question;
}

HttpAnswer logAnswer(const ServedDevice& device, const HttpRequest& request) {
    const std::optional<LogQuestion> question = logQuestion(request);
    if (!question) return refusal(400, "level, category or limit is none that a log knows");
    const Result<std::string> text =
        logText(device.path() + "/" + std::string(kLogName), *question);
    if (!text) return refusal(503, text.error().description());
    return {.body = *text};
}

HttpAnswer viewAnswer(ServedDevice& device, const HttpRequest& request) {
    const std::shared_ptr<const DeviceView> view = device.view(device.ask(), kLongestView);
    const std::optional<std::string> since = given(request, "since");
    return {.body = viewText(*view, device.name(), since ? countIn(*since) : std::nullopt)};
}

// Of one application, whose identifier is the last piece of the address.
HttpAnswer applicationAnswer(ServedDevice& device, const std::string& what,
                             const std::string& identifier) {
    if (!isLegalIdentifier(identifier)) return refusal(404, "there is no such application");
    if (what == "icon") return device.icon(identifier);
    if (what == "why") {
        return device.answer(
            [identifier](Device& opened) { return whyAnswer(opened, identifier); });
    }
    if (what != "history") return nothingHere();
    return device.answer(
        [identifier](Device& opened) { return historyAnswer(opened, identifier); });
}

}  // namespace

Result<std::unique_ptr<LivePage>> LivePage::open(const std::string& path,
                                                 ServedDevices::IsDevice isDevice,
                                                 std::string version) {
    std::unique_ptr<LivePage> page(new LivePage(std::move(version)));
    Result<std::unique_ptr<ServedDevices>> devices =
        ServedDevices::open(path, isDevice, page->bell_);
    if (!devices) return devices.error();
    page->devices_ = *std::move(devices);
    return page;
}

std::size_t LivePage::leftOut() {
    static_cast<void>(devices_->all());
    return devices_->leftOut();
}

void LivePage::end() { bell_.silence(); }

HttpAnswer LivePage::answer(const HttpRequest& request) {
    const std::vector<std::string>& path = request.path;
    if (path.empty()) return fileAnswer("index.html");
    if (path.size() == 1 && path[0] == "favicon.ico") return {.status = 204, .type = "image/png"};
    if (path.size() == 1) return fileAnswer(path[0]);
    if (path[0] != "api") return nothingHere();
    if (path.size() == 2 && path[1] == "devices") return devicesAnswer();
    if (path.size() == 2 && path[1] == "events") {
        return {.events = eventsOf(*devices_, bell_)};
    }
    return path[1] == "device" ? deviceAnswer(request) : nothingHere();
}

HttpAnswer LivePage::devicesAnswer() {
    const std::vector<std::shared_ptr<ServedDevice>> devices = devices_->all();
    std::vector<std::uint64_t> tickets;
    tickets.reserve(devices.size());
    for (const auto& each : devices) tickets.push_back(each->ask());
    const PageClock::time_point deadline = PageClock::now() + kLongestView;
    PageJson cards = PageJson::array();
    for (std::size_t index = 0; index < devices.size(); ++index) {
        const auto left = std::max(PageClock::duration::zero(), deadline - PageClock::now());
        const auto longest = std::chrono::ceil<std::chrono::milliseconds>(left);
        const auto view = devices[index]->view(tickets[index], longest);
        cards.push_back(cardOf(*devices[index], *view));
    }
    return {.body = dumped({{"version", version_},
                            {"folder", devices_->isFolder()},
                            {"leftOut", devices_->leftOut()},
                            {"devices", std::move(cards)}})};
}

HttpAnswer LivePage::deviceAnswer(const HttpRequest& request) {
    if (request.path.size() < 3) return nothingHere();
    const std::shared_ptr<ServedDevice> device = devices_->find(request.path[2]);
    if (!device) return refusal(404, "no device of this name is served");
    return ofDevice(device, request);
}

HttpAnswer LivePage::ofDevice(const std::shared_ptr<ServedDevice>& device,
                              const HttpRequest& request) {
    const std::vector<std::string>& path = request.path;
    if (path.size() == 3) return viewAnswer(*device, request);
    if (path.size() == 5) return applicationAnswer(*device, path[3], path[4]);
    if (path.size() != 4) return nothingHere();
    if (path[3] == "events") return {.events = eventsOf(device, bell_)};
    if (path[3] == "timeline.svg") {
        return device->answerSeldom(
            [name = device->name()](Device& opened) { return timelineAnswer(opened, name); });
    }
    if (path[3] == "log") return logAnswer(*device, request);
    if (path[3] == "history") {
        return device->answer([](Device& opened) { return historyAnswer(opened, std::nullopt); });
    }
    return nothingHere();
}

}  // namespace appsync
