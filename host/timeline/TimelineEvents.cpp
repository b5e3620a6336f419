#include "host/timeline/TimelineEvents.h"

#include <algorithm>
#include <array>
#include <unordered_map>

namespace appsync {
namespace {

using enum TimelineEventKind;

constexpr std::string_view kOffloaded = "it is offloaded";

constexpr std::array kMessages = {
    TimelineMessage{"%s|starting to reconcile sync with new anchor %{public}@", SyncBegins},
    TimelineMessage{"%s|reconcileRestoreOfType %d", RestoreBegins},
    TimelineMessage{"%s|finished reconcile sync", ReconciliationEnds},
    TimelineMessage{"%s|getting installed assets", InventoryBegins},
    TimelineMessage{"%s|outstandingAssetTransfers starting with todoList %{public}@", AskingBegins},
    TimelineMessage{"%s|Waiting for -applicationInstallsArePrioritized:arePaused: to complete...",
                    RegistryAsked},
    TimelineMessage{"%s|Wait completed", RegistryAnswered},
    TimelineMessage{"%s|Query for in progress assets timed out", RegistryAnswered},
    TimelineMessage{"%s|Will wait for %lld seconds for %lld placeholders to install",
                    PlaceholdersAwaited},
    TimelineMessage{"%s|Finished waiting for placeholder installs", PlaceholdersThere},
    TimelineMessage{"%s|asset transfer ended withsuccess: %c", TransfersEnd},
    TimelineMessage{"%s|sync ended with success: %c", SessionEnds},
    TimelineMessage{"%s|Asset %{public}@ (pretty=%{public}@, version=%{public}@) prepped with icon "
                    "%{public}@, at %{public}@, meta at %{public}@, info at %{public}@, "
                    "storePid=%lld, isRestore=%c",
                    Asked, 1, 2, 3},
    TimelineMessage{"%s|processing vessik restore info for '%{public}@' demotionStatus :%lu", Asked,
                    1},
    TimelineMessage{"%s sends %{public}@, which the device has not asked for", DeliveryBegins, 1},
    TimelineMessage{"%s|skipping %{public}@ - its not a restore and app installation is disabled",
                    Skipped, 1, 0, 0, 0, "device policy does not allow installing applications"},
    TimelineMessage{"%s|%{public}@ is currenlty marked as to be ignored for download - skipping",
                    Skipped, 1, 0, 0, 0, "it is marked as one to be ignored"},
    TimelineMessage{"%s|%{public}@ is currenlty marked to be restored and will be handled by "
                    "bazaard - skipping",
                    Skipped, 1, 0, 0, 0, "a restore brings it"},
    TimelineMessage{
        "%s|%{public}@ is auto demoted: %d, manual demoted: %d, system app:%d - skipping", Skipped,
        1, 0, 0, 0, kOffloaded},
    TimelineMessage{"%s|%{public}@ is currenlty demoted (manual:%d, auto:%d) - skipping", Skipped,
                    1, 0, 0, 0, kOffloaded},
    TimelineMessage{"%s|%{public}@ is system app placeholder - skipping", Skipped, 1, 0, 0, 0,
                    "it belongs to the system"},
    TimelineMessage{"%s|%{public}@ already has a placeholder - skipping", Skipped, 1, 0, 0, 0,
                    "it has a placeholder already"},
    TimelineMessage{"%s|placeholder already exists for '%{public}@' - skiping'", Skipped, 1, 0, 0,
                    0, "it has a placeholder already"},
    TimelineMessage{"%s|no vessik restore info for '%{public}@' - skipping", Skipped, 1, 0, 0, 0,
                    "the backup tells nothing of it"},
    TimelineMessage{"%s|Created app directory for '%{public}@' at %{public}@ with err=%{public}@",
                    PlaceholderBegins, 1},
    TimelineMessage{
        "%s|processing app install for bundle '%{public}@', title %{public}@ assetplist "
        "%{public}@, version %{public}@ with install coordination",
        PlaceholderBegins, 1},
    TimelineMessage{
        "%s|processing app restore for demoted bundle '%{public}@' with install coordination",
        PlaceholderBegins, 1},
    TimelineMessage{
        "%s|processing app restore for non demoted bundle '%{public}@' with install coordination",
        PlaceholderBegins, 1},
    TimelineMessage{"%s|processing app restore info for '%{public}@'", PlaceholderBegins, 1},
    TimelineMessage{"%s|Installed Placeholder app from path %{public}@: %{public}@ [%{public}@ "
                    "%{public}@] [isPressel: %{public}@]",
                    PlaceholderEnds, 3},
    TimelineMessage{"%s|coordinatorDidInstallPlaceholder for %{public}@ with error %{public}@",
                    PlaceholderEnds, 1, 2},
    TimelineMessage{"%s|Placeholder app install failed from path %{public}@: %{public}@ "
                    "[%{public}@ %{public}@] [isPressel: %{public}@]",
                    PlaceholderFails, 3, 0, 0, 0, "its placeholder could not be made"},
    TimelineMessage{"%s|failed to create app directory for '%{public}@'. err=%{public}@",
                    PlaceholderFails, 1, 2},
    TimelineMessage{"%s|processing app install for bundle %{public}@ finished with status %d error "
                    "%{public}@",
                    PlaceholderFails, 1, 3, 0, 2},
    TimelineMessage{"%s|processing app restore for %{public}@ finished with status %d error "
                    "%{public}@",
                    PlaceholderFails, 1, 3, 0, 2},
    TimelineMessage{"%s|processing app restore for demoted app %{public}@ finished with status %d "
                    "error %{public}@",
                    PlaceholderFails, 1, 3, 0, 2},
    TimelineMessage{"%s|finished transferring %lf for %{public}@", TransferGoesOn, 2},
    TimelineMessage{
        "%s|transfer for asset %{public}@ ended with success %c error %{public}@ existingApp:%d",
        TransferEnds, 1, 3, 0, 2},
    TimelineMessage{"%s|Enqueue install request for %{public}@", InstallQueued, 1},
    TimelineMessage{"%s|Performing install for %{public}@", InstallBegins, 1},
    TimelineMessage{"%s|Satisfying asset promise for %{public}@", InstallBegins, 1},
    TimelineMessage{"%s|Assertion denied for %{public}@", TerminationDenied, 1},
    TimelineMessage{"%s|%{public}@ install succeeded", InstallEnds, 1},
    TimelineMessage{"%s|%{public}@ install failed but was recoverable: %{public}@", InstallEnds, 1,
                    2},
    TimelineMessage{"%s|%{public}@ install failed unrecoverably: %{public}@", InstallEnds, 1, 2},
    TimelineMessage{"%s|coordinatorDidCompleteSuccessfully for %{public}@ with error %{public}@",
                    InstallEnds, 1, 2},
    TimelineMessage{"%s|set CQClientAppStore to satisfy app asset promise for %{public}@",
                    StoreAwaited, 1},
    TimelineMessage{"%s|App asset DRI for %{public}@ is set to %lu - nothing more for trd to do",
                    StoreAwaited, 1},
    TimelineMessage{"%s|Cancelling asset sync for %{public}@", Cancelled, 1, 0, 0, 0,
                    "somebody on the device did"},
    TimelineMessage{"%s|Relocant cancelled coordinator for restoring app bundle %{public}@ "
                    "_restoringPlaceholderCount %lld",
                    Cancelled, 1, 0, 0, 0, "the coordination service did"},
    TimelineMessage{"%s|%{public}@ targeted for termination", RemovalBegins, 1},
    TimelineMessage{"%s|Uninstall of %{public}@ failed.", RemovalEnds, 1, 0, 0, 0,
                    "it could not be removed"},
    TimelineMessage{"%s|Uninstall of %{public}@ with install coordinator succeeded wiht error "
                    "%{public}@.",
                    RemovalEnds, 1, 2},
};

std::string argumentAt(const std::vector<std::string>& arguments, int index) {
    const auto at = static_cast<std::size_t>(index);
    return index == 0 || at >= arguments.size() ? std::string() : arguments[at];
}

/// Where the package lay on the device is of no interest to anybody.
std::string withoutPath(const std::string& sentence) {
    constexpr std::string_view kPackage = "package '/";
    if (!sentence.starts_with(kPackage)) return sentence;
    const std::size_t end = sentence.find("': ");
    return end == std::string::npos ? sentence : "its package: " + sentence.substr(end + 3);
}

/// The sentence of an error that a message renders as `Error Domain=... Code=... "sentence"`.
std::string sentenceOf(const std::string& error) {
    if (error == "(null)") return {};
    if (!error.starts_with("Error Domain=")) return error;
    const std::size_t begin = error.find('"');
    if (begin == std::string::npos) return error;
    const std::size_t end = error.rfind('"');
    if (end == begin)
        return withoutPath(error.substr(begin + 1) + "\xE2\x80\xA6");  // it was cut off
    const std::string sentence = error.substr(begin + 1, end - begin - 1);
    return sentence == "(null)" ? error.substr(0, begin) : withoutPath(sentence);
}

/// A recording has the number of the character.
bool tellsOfSuccess(const std::string& argument) {
    return argument == "1" || argument == "y" || argument == std::to_string(int{'y'});
}

/// Where the placeholder of a format that begins there ends: behind its conversion.
std::size_t endOfConversion(std::string_view format, std::size_t at) {
    std::size_t end = at + 1;
    if (end < format.size() && format[end] == '{') end = format.find('}', end);
    if (end == std::string_view::npos) return format.size();
    constexpr std::string_view kConversions = "@dcfsu";
    end = format.find_first_of(kConversions, end);
    return end == std::string_view::npos ? format.size() : end + 1;
}

}  // namespace

bool isOfSession(TimelineEventKind kind) { return kind < Asked; }

const TimelineMessage* messageOfFormat(std::string_view format) {
    static const auto byFormat = [] {
        std::unordered_map<std::string_view, const TimelineMessage*> map;
        for (const TimelineMessage& each : kMessages) map.emplace(each.format, &each);
        return map;
    }();
    const auto found = byFormat.find(format);
    return found == byFormat.end() ? nullptr : found->second;
}

TimelineEvent eventOfMessage(const TimelineMessage& message,
                             const std::vector<std::string>& arguments) {
    TimelineEvent event;
    event.kind = message.kind;
    event.identifier = argumentAt(arguments, message.identifier);
    event.version = argumentAt(arguments, message.version);
    if (message.kind == Asked) {
        event.detail = argumentAt(arguments, message.detail);
        return event;
    }
    event.detail = message.reason.empty() ? sentenceOf(argumentAt(arguments, message.detail))
                                          : std::string(message.reason);
    if (message.success == 0) return event;
    if (tellsOfSuccess(argumentAt(arguments, message.success))) {
        event.detail.clear();
    } else if (event.detail.empty()) {
        event.detail = "nobody says why";
    }
    return event;
}

std::vector<std::string> argumentsOfMessage(std::string_view format, std::string_view message) {
    std::vector<std::string> arguments;
    std::size_t at = format.find('%');
    if (at == std::string_view::npos || !message.starts_with(format.substr(0, at))) return {};
    message.remove_prefix(at);
    while (at < format.size()) {
        const std::size_t begin = endOfConversion(format, at);
        at = std::min(format.find('%', begin), format.size());
        const std::string_view between = format.substr(begin, at - begin);
        if (at == format.size()) {
            if (!message.ends_with(between)) return arguments;
            arguments.emplace_back(message.substr(0, message.size() - between.size()));
            return arguments;
        }
        const std::size_t end = message.find(between);
        if (end == std::string_view::npos) return arguments;
        arguments.emplace_back(message.substr(0, end));
        message.remove_prefix(end + between.size());
    }
    return arguments;
}

}  // namespace appsync
