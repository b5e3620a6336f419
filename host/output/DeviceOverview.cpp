#include "host/output/DeviceOverview.h"

#include <algorithm>
#include <sstream>
#include <utility>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;

// As `set` takes them.
const char* settingText(PolicyAnswer answer) {
    switch (answer) {
        case PolicyAnswer::Yes:
            return "yes";
        case PolicyAnswer::No:
            return "no";
        case PolicyAnswer::Unset:
            break;
    }
    return "unset";
}

const char* settingText(bool isOn) { return isOn ? "on" : "off"; }

const char* sessionText(const DeviceOverview& overview) {
    if (overview.session.isUnderWay) return "under way";
    return overview.session.wasInterrupted || !overview.open.empty() ? "interrupted" : "none";
}

const char* stagedText(StagedWork staged) {
    switch (staged) {
        case StagedWork::Waiting:
            return "waiting";
        case StagedWork::Interrupted:
            return "interrupted";
        case StagedWork::None:
            break;
    }
    return "none";
}

std::string namesText(const std::vector<std::string>& identifiers) {
    std::string text;
    for (const std::string& each : identifiers)
        text += (text.empty() ? "" : ", ") + printable(each);
    return text;
}

// What still waits for an application to end goes on when that has.
std::string openWorkText(const DeviceOverview& overview) {
    std::vector<std::string> running;
    for (const std::string& each : overview.open) {
        if (std::ranges::find(overview.running, each) != overview.running.end())
            running.push_back(each);
    }
    const std::string quit = running.empty() ? "" : "quit " + namesText(running) + ", and ";
    const std::string open = overview.open.empty()
                                 ? ""
                                 : ", with " + namesText(overview.open) + " still to be installed";
    return open + ": " + quit + "run the command again that was cut off";
}

std::string sessionLine(const DeviceOverview& overview) {
    const SessionRecord& session = overview.session;
    std::string text = sessionText(overview);
    if (session.process) text += ", process " + std::to_string(*session.process);
    const bool isOver = !session.isUnderWay && (session.wasInterrupted || !overview.open.empty());
    return isOver ? text + openWorkText(overview) : text;
}

std::string stagedLine(StagedWork staged) {
    std::string text = stagedText(staged);
    if (staged == StagedWork::None) return text;
    const bool waits = staged == StagedWork::Waiting;
    return text + ": appsync sync DEVICE LIBRARY --staged " +
           (waits ? "sends what it asks for" : "goes on with it");
}

std::string runningLine(const std::vector<std::string>& running) {
    return running.empty() ? "none" : namesText(running);
}

std::string spaceLine(const DeviceOverview& overview) {
    return formatBytes(overview.free) +
           (overview.reserve == 0
                ? ", and nothing kept back for a full disk"
                : ", and " + formatBytes(overview.reserve) + " kept back for a full disk");
}

// Most devices have none.
std::string keptLine(const DeviceOverview& overview) {
    if (overview.kept == 0) return "";
    return "\nkept versions: " + std::to_string(overview.kept) + ", " +
           formatBytes(overview.keptBytes) + " of the free space, until that is needed";
}

std::string applicationsLine(const DeviceOverview& overview) {
    return std::to_string(overview.installed) + " installed, " +
           std::to_string(overview.offloaded) + " offloaded, " + std::to_string(overview.restored) +
           " restored, " + std::to_string(overview.arriving) + " arriving";
}

std::string wrappedLines(const std::string& text, std::size_t width) {
    constexpr std::size_t kIndent = 15;  // below what the first line says
    constexpr std::size_t kNarrow = 40;
    std::string result;
    std::istringstream lines(text);
    for (std::string line; std::getline(lines, line);) {
        result += wrapped(std::move(line), width, width < kNarrow ? 2 : kIndent) + "\n";
    }
    return result;
}

// Of a session that is over.
std::vector<std::string> openInstalls(const DeviceMoment& moment, bool isCoordinated) {
    std::vector<std::string> open;
    for (const auto& [identifier, status] : moment.applications) {
        const bool isOpen = isCoordinated
                                ? status.coordinator && isOpenInstall(*status.coordinator)
                                : status.placeholder && isOpenInstall(*status.placeholder);
        if (isOpen) open.push_back(identifier);
    }
    return open;
}

void countAll(DeviceOverview& overview, const DeviceMoment& moment) {
    for (const auto& [identifier, status] : moment.applications) {
        if (status.installed) count(overview, *status.installed);
        if (status.placeholder) count(overview, *status.placeholder);
        if (status.isRunning) overview.running.push_back(identifier);
    }
}

}  // namespace

Result<DeviceOverview> overviewOf(Device& device, const DeviceMoment& moment) {
    DeviceOverview overview;
    const Result<DeviceSettings> settings = device.settings();
    if (!settings) return unusable(settings.error());
    overview.settings = *settings;
    countAll(overview, moment);
    overview.session = moment.session;
    if (!moment.session.isUnderWay) {
        overview.staged = stagedWorkOn(device);
        overview.open = openInstalls(moment, settings->coordination);
    }
    const Result<std::uint64_t> free = device.freeSpace();
    if (!free) return unusable(free.error());
    overview.free = *free;
    overview.reserve = device.spaceReserve();
    return overview;
}

void count(DeviceOverview& overview, const ApplicationRecord& record) {
    if (record.kept) {
        ++overview.kept;
        overview.keptBytes += record.kept->bytes;
    }
    if (!record.isPlaceholder) {
        ++overview.installed;
        return;
    }
    switch (record.installType) {
        case kInstallTypeDowngrade:
        case kInstallTypeIntentionalDowngrade:
            ++overview.offloaded;
            return;
        case kInstallTypeRestore:
            ++overview.restored;
            return;
        default:
            ++overview.arriving;
    }
}

bool isOpenInstall(const ApplicationRecord& record) {
    return record.isPlaceholder && record.installType == kInstallTypeSync;
}

bool isOpenInstall(const CoordinatorRecord& coordinator) {
    return coordinator.client == SyncClientID && !coordinator.restores();
}

std::string overviewText(const DeviceOverview& overview, std::size_t width) {
    const DeviceSettings& settings = overview.settings;
    const std::string text = std::string("installation:  ") + settingText(settings.installation) +
                             "\nremoval:       " + settingText(settings.removal) +
                             "\ncoordination:  " + settingText(settings.coordination) +
                             "\napplications:  " + applicationsLine(overview) +
                             "\nrunning:       " + runningLine(overview.running) +
                             "\nsession:       " + sessionLine(overview) +
                             "\nstaging area:  " + stagedLine(overview.staged) +
                             "\nfree space:    " + spaceLine(overview) + keptLine(overview) + "\n";
    return wrappedLines(text, width);
}

std::string jsonText(const DeviceOverview& overview) { return indented(jsonOf(overview)); }

nlohmann::ordered_json jsonOf(const DeviceOverview& overview) {
    const DeviceSettings& settings = overview.settings;
    const std::optional<std::int64_t>& process = overview.session.process;
    return {{"installation", settingText(settings.installation)},
            {"removal", settingText(settings.removal)},
            {"coordination", settingText(settings.coordination)},
            {"installed", overview.installed},
            {"offloaded", overview.offloaded},
            {"restored", overview.restored},
            {"arriving", overview.arriving},
            {"running", overview.running},
            {"session", sessionText(overview)},
            {"process", process ? Json(*process) : Json()},
            {"open", overview.open},
            {"staged", stagedText(overview.staged)},
            {"free", overview.free},
            {"reserve", overview.reserve},
            {"kept", overview.kept},
            {"keptBytes", overview.keptBytes}};
}

}  // namespace appsync
