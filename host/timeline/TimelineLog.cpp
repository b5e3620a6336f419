#include "host/timeline/TimelineLog.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cstdint>
#include <string>
#include <unordered_set>
#include <utility>

#include <nlohmann/json.hpp>

namespace appsync {
namespace {

using enum TimelineEventKind;
using LogTime = std::chrono::system_clock::time_point;

/// What a device's log has at the end of each line: the format, as it stands in the code. None that
/// matters here needs an escape in JSON, and in no text does a quotation mark stand by itself.
std::string_view formatOfLine(std::string_view line) {
    constexpr std::string_view kBefore = R"(,"format":")";
    constexpr std::string_view kBehind = R"("})";
    if (!line.ends_with(kBehind)) return {};
    const std::size_t begin = line.rfind(kBefore);
    if (begin == std::string_view::npos) return {};
    line.remove_suffix(kBehind.size());
    return line.substr(std::min(begin + kBefore.size(), line.size()));
}

/// The identifier that a message names, as it stands in the line.
std::string identifierIn(const LoggedMessage& line) {
    constexpr std::string_view kBefore = R"("message":")";
    constexpr std::string_view kBehind = R"(","format":")";
    const std::size_t before = line.line.find(kBefore);
    const std::size_t end = line.line.rfind(kBehind);
    if (before == std::string_view::npos || end < before + kBefore.size()) return {};
    const std::size_t begin = before + kBefore.size();
    const std::vector<std::string> arguments =
        argumentsOfMessage(line.message->format, line.line.substr(begin, end - begin));
    const auto at = static_cast<std::size_t>(line.message->identifier);
    return at < arguments.size() ? arguments[at] : std::string();
}

/// Puts lines into sessions. Where nothing tells that packages are sent unasked, as in logs of
/// former versions, those that are transferred when a session is over, or when nobody goes on with
/// it, begin another. Of a restore the last message may be the one on its placeholders.
class SessionSorting {
  public:
    void add(const LoggedMessage& line) {
        const TimelineEventKind kind = line.message->kind;
        const bool isTransfer = kind == TransferGoesOn || kind == TransferEnds;
        const bool isBegin = kind == SyncBegins || kind == RestoreBegins || kind == DeliveryBegins;
        if (isBegin || (isTransfer && isUnasked(line))) {
            begin(kind);
        } else if (sessions_.empty() && !isOfSession(kind)) {
            begin(kind);
            sessions_.back().lacksBeginning = true;
        }
        if (sessions_.empty() || (isOver_ && !isOfRestore_)) return;
        sessions_.back().lines.push_back(line);
        if (kind == Asked) asked_.insert(identifierIn(line));
        hasTransferred_ = hasTransferred_ || kind == TransfersEnd;
        isOver_ = kind == SessionEnds || (isOver_ && isOfRestore_) ||
                  (isOfRestore_ && kind == PlaceholdersThere);
    }

    [[nodiscard]] std::vector<LoggedSession> take() { return std::move(sessions_); }

  private:
    void begin(TimelineEventKind kind) {
        sessions_.emplace_back();
        asked_.clear();
        isOver_ = false;
        hasTransferred_ = false;
        isOfSync_ = kind == SyncBegins;
        isOfRestore_ = kind == RestoreBegins;
    }

    /// A sync that was killed ends without a word.
    [[nodiscard]] bool isUnasked(const LoggedMessage& line) const {
        if (isOver_ || hasTransferred_) return true;
        return isOfSync_ && !asked_.contains(identifierIn(line));
    }

    std::vector<LoggedSession> sessions_;
    std::unordered_set<std::string> asked_;  // of the session
    bool isOver_ = false;
    bool hasTransferred_ = false;
    bool isOfSync_ = false;
    bool isOfRestore_ = false;
};

/// A number of that many digits, which goes from the text.
std::optional<int> digitsOf(std::string_view& text, std::size_t count) {
    int number = 0;
    if (text.size() < count) return std::nullopt;
    const char* end = text.data() + count;
    const auto [stop, error] = std::from_chars(text.data(), end, number);
    if (error != std::errc() || stop != end) return std::nullopt;
    text.remove_prefix(count);
    return number;
}

/// Any two times between them can be subtracted.
constexpr int kFirstYear = 1970;
constexpr int kLastYear = 2200;

/// "2026-11-23T07:30:03.267953Z"
std::optional<LogTime> timeOfLine(std::string_view text) {
    constexpr std::array<std::size_t, 7> kDigits = {4, 2, 2, 2, 2, 2, 6};
    constexpr std::string_view kBehind = "--T::.Z";
    std::array<int, kDigits.size()> parts{};
    for (std::size_t i = 0; i < kDigits.size(); ++i) {
        const std::optional<int> number = digitsOf(text, kDigits.at(i));
        if (!number || *number < 0 || !text.starts_with(kBehind.at(i))) return std::nullopt;
        parts.at(i) = *number;
        text.remove_prefix(1);
    }
    const std::chrono::year_month_day day{std::chrono::year{parts[0]},
                                          std::chrono::month{static_cast<unsigned>(parts[1])},
                                          std::chrono::day{static_cast<unsigned>(parts[2])}};
    if (!day.ok() || parts[0] < kFirstYear || parts[0] > kLastYear) return std::nullopt;
    return std::chrono::sys_days(day) + std::chrono::hours(parts[3]) +
           std::chrono::minutes(parts[4]) + std::chrono::seconds(parts[5]) +
           std::chrono::microseconds(parts[6]);
}

std::string textOf(const nlohmann::json& line, const char* member) {
    const auto found = line.find(member);
    return found != line.end() && found->is_string() ? found->get<std::string>() : std::string();
}

}  // namespace

std::vector<LoggedSession> sessionsInLog(std::string_view text) {
    SessionSorting sorting;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find('\n'), text.size());
        const std::string_view line = text.substr(0, end);
        text.remove_prefix(std::min(end + 1, text.size()));
        const TimelineMessage* message = messageOfFormat(formatOfLine(line));
        if (message != nullptr) sorting.add({line, message});
    }
    return sorting.take();
}

std::optional<TimedEvent> eventOfLine(const LoggedMessage& line) {
    const nlohmann::json parsed =
        nlohmann::json::parse(line.line.begin(), line.line.end(), nullptr, false);
    if (!parsed.is_object()) return std::nullopt;
    const std::optional<LogTime> time = timeOfLine(textOf(parsed, "time"));
    if (!time) return std::nullopt;
    return TimedEvent{
        *time, eventOfMessage(*line.message,
                              argumentsOfMessage(line.message->format, textOf(parsed, "message")))};
}

}  // namespace appsync
