#include "host/timeline/TimelineOfRecording.h"

#include <optional>
#include <vector>

#include "host/timeline/TimelineBuilding.h"
#include "host/timeline/TimelineEvents.h"

namespace appsync {
namespace {

/// An argument of a message as the log would have it.
std::string argumentText(const nlohmann::json& value) {
    if (value.is_null()) return "(null)";
    if (const std::optional<std::string> text = textIn(value)) return *text;
    return value.is_object() ? "left out of the recording" : value.dump();
}

/// "LogFacility.write": category, level, format, arguments.
std::optional<TimelineEvent> eventOfRecord(const RecordLine& line) {
    constexpr std::size_t kArguments = 4;
    const nlohmann::json& given = line.arguments;
    const bool isMessage = line.kind == RecordKind::Call && line.name == "LogFacility.write" &&
                           given.size() == kArguments && given[2].is_string() &&
                           given[3].is_array();
    if (!isMessage) return std::nullopt;
    const TimelineMessage* message = messageOfFormat(given[2].get_ref<const std::string&>());
    if (message == nullptr) return std::nullopt;
    std::vector<std::string> arguments;
    arguments.reserve(given[3].size());
    for (const nlohmann::json& each : given[3]) arguments.push_back(argumentText(each));
    TimelineEvent event = eventOfMessage(*message, arguments);
    event.at = line.time;
    event.thread = line.thread;
    return event;
}

/// The host's calls; one that has no end goes on.
std::vector<TimelinePhase> callsOf(const RecordedSession& session, TimelineMoment end) {
    std::vector<TimelinePhase> calls;
    for (const RecordStretch& stretch : session.stretches) {
        const RecordLine& begin = session.lines[stretch.beginning];
        if (begin.kind != RecordKind::Host) continue;
        const RecordLine* last =
            stretch.lines.empty() ? nullptr : &session.lines[stretch.lines.back()];
        const bool isOver = last != nullptr && last->kind == RecordKind::End;
        // NOLINTNEXTLINE(performance-inefficient-vector-operation): most stretches are no calls
        calls.push_back({begin.name, begin.time, isOver ? last->time : end});
    }
    return calls;
}

}  // namespace

Timeline timelineOfRecording(const RecordedSession& session, const std::string& shownName) {
    TimelineBuilding building;
    for (const RecordLine& line : session.lines) {
        std::optional<TimelineEvent> event = eventOfRecord(line);
        if (event) building.add(*std::move(event));
    }
    const TimelineMoment end =
        session.lines.empty() ? TimelineMoment(0) : session.lines.back().time;
    Timeline timeline = building.finish(end, session.isCutOff);
    timeline.source = "recording " + shownName;
    if (timeline.kind.empty()) timeline.kind = "session";
    timeline.calls = callsOf(session, end);
    if (session.isCutOff) {
        timeline.notes.emplace_back("The recording is cut off: the session went on.");
    }
    return timeline;
}

}  // namespace appsync
