#include "host/timeline/TimelineOfDevice.h"

#include <algorithm>
#include <map>
#include <set>
#include <string_view>
#include <utility>

#include "device/Device.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"
#include "host/timeline/TimelineBuilding.h"
#include "host/timeline/TimelineLog.h"
#include "system/LogFile.h"

namespace appsync {
namespace {

/// More than both parts of a log may hold.
constexpr std::uint64_t kLargestLogPart = std::uint64_t{64} << 20U;
/// The history knows no sessions: what lies further apart belongs to two.
constexpr std::chrono::seconds kBetweenSessions{60};

using TimedEvents = std::vector<TimedEvent>;

/// What is known of one session of a device.
struct DeviceSession {
    TimedEvents events;
    std::vector<std::string> notes;
    bool goesOn = false;
    /// The log has nothing of it.
    bool isOfHistory = false;
};

Result<Bytes> logPart(const std::string& path) {
    if (!isHostFile(path)) return Bytes();
    Result<Bytes> bytes = readGrowingHostFile(path, kLargestLogPart);
    if (!bytes) return unusable(bytes.error());
    return bytes;
}

ErrorRecord noSuchSession(std::size_t known) {
    return failure("the device tells of " + counted(known, "session"),
                   known > 1
                       ? "give --session a number from 1, the last, to " + std::to_string(known)
                       : "leave --session out");
}

TimedEvents eventsOf(const LoggedSession& session) {
    TimedEvents events;
    events.reserve(session.lines.size());
    for (const LoggedMessage& line : session.lines) {
        std::optional<TimedEvent> event = eventOfLine(line);
        if (event) events.push_back(*std::move(event));
    }
    return events;
}

/// The log of a device, as far as the wanted session needs it. The sessions are pieces of the
/// text, also when it is moved.
struct ReadLog {
    Bytes text;
    std::vector<LoggedSession> sessions;

    static Result<ReadLog> read(const std::string& path, std::size_t wanted) {
        Result<Bytes> text = logPart(path);
        if (!text) return text.error();
        ReadLog log = of(*std::move(text));
        const bool isEnough = log.sessions.size() >= wanted &&
                              !log.sessions[log.sessions.size() - wanted].lacksBeginning;
        if (isEnough) return log;
        Result<Bytes> older = logPart(olderPartOf(path));
        if (!older) return older.error();
        if (older->empty()) return log;
        older->insert(older->end(), log.text.begin(), log.text.end());
        return of(*std::move(older));
    }

  private:
    static ReadLog of(Bytes text) {
        ReadLog log{std::move(text), {}};
        const auto* begin = reinterpret_cast<const char*>(log.text.data());
        log.sessions = sessionsInLog({begin, log.text.size()});
        return log;
    }
};

/// What the history knows in addition: all of it where the log has nothing.
Status addHistory(Device& device, DeviceSession& session, bool isLogged) {
    const Result<std::vector<HistoryRecord>> records = device.history();
    if (!records) return records.error();
    std::optional<WallTime> first;
    if (!session.events.empty()) first = session.events.front().time;
    TimedEvents events = eventsBefore(*records, first);
    if (isLogged && events.empty()) return {};
    if (isLogged) {
        session.notes.emplace_back(
            "The log has lost the beginning of this session: drawn is what the history has of it, "
            "and no transfers.");
    } else if (!events.empty()) {
        session.notes.emplace_back(
            "The log tells of no session: drawn is what the history has of the last one, and no "
            "transfers or ends of installs.");
        session.isOfHistory = true;
    }
    std::move(session.events.begin(), session.events.end(), std::back_inserter(events));
    session.events = std::move(events);
    return {};
}

std::set<std::string> installsUnderWay(const TimedEvents& events) {
    std::set<std::string> identifiers;
    for (const TimedEvent& each : events) {
        const TimelineEventKind kind = each.event.kind;
        if (kind == TimelineEventKind::InstallBegins) identifiers.insert(each.event.identifier);
        const bool isOver =
            kind == TimelineEventKind::InstallEnds || kind == TimelineEventKind::Cancelled;
        if (isOver) identifiers.erase(each.event.identifier);
    }
    return identifiers;
}

/// An install that waits for its application to end: on the coordinated path only the device knows.
Status addDenials(Device& device, DeviceSession& session) {
    const Result<std::vector<std::string>> running = device.running();
    if (!running) return running.error();
    const std::set<std::string> installing = installsUnderWay(session.events);
    for (const std::string& identifier : *running) {
        if (!installing.contains(identifier)) continue;
        const Result<ApplicationStatus> status = device.status(identifier);
        if (!status) return status.error();
        const WallTime latest = session.events.back().time;
        TimelineEvent denied;
        denied.kind = TimelineEventKind::TerminationDenied;
        denied.identifier = identifier;
        session.events.push_back(
            {status->denial ? std::max(status->denial->when, latest) : latest, denied});
    }
    return {};
}

Result<DeviceSession> sessionOf(Device& device, std::size_t wanted) {
    const Result<ReadLog> log = ReadLog::read(device.logPath(), wanted);
    if (!log) return log.error();
    const std::size_t known = log->sessions.size();
    if (wanted > std::max<std::size_t>(known, 1)) return noSuchSession(known);
    DeviceSession session;
    const bool isLogged = known != 0;
    if (isLogged) session.events = eventsOf(log->sessions[known - wanted]);
    Status added;
    if (!isLogged || log->sessions[known - wanted].lacksBeginning) {
        added = addHistory(device, session, isLogged);
    }
    const Result<SessionRecord> state = device.session();
    if (!state) return state.error();
    session.goesOn = state->isUnderWay && wanted == 1;
    if (added && wanted == 1 && !session.events.empty()) added = addDenials(device, session);
    if (!added) return added.error();
    const bool isOver = std::any_of(
        session.events.begin(), session.events.end(),
        [](const TimedEvent& each) { return each.event.kind == TimelineEventKind::SessionEnds; });
    if (session.goesOn && !isOver) {
        session.notes.emplace_back("The session goes on.");
    } else if (state->wasInterrupted && wanted == 1) {
        session.notes.emplace_back("The session was interrupted.");
    }
    return session;
}

/// Reasons that only the device's table of failures has.
Status addReasons(Device& device, Timeline& timeline) {
    const Result<std::vector<FailedInstall>> failed = device.failedInstalls();
    if (!failed) return failed.error();
    std::map<std::string_view, const InstallFailure*> byIdentifier;
    for (const FailedInstall& each : *failed) byIdentifier[each.identifier] = &each.failure;
    for (TimelineLane& lane : timeline.lanes) {
        const auto found = byIdentifier.find(lane.identifier);
        if (found == byIdentifier.end() || found->second->when < *timeline.began) continue;
        if (lane.outcome != LaneOutcome::Failed && lane.outcome != LaneOutcome::Open) continue;
        lane.outcome = LaneOutcome::Failed;
        if (lane.reason.empty()) lane.reason = found->second->error.description();
    }
    return {};
}

std::optional<TimelineEventKind> kindOfScenario(const HistoryRecord& record) {
    using enum TimelineEventKind;
    const bool isOfPlaceholder =
        record.scenario == "Install placeholder" || record.scenario == "Vessik App Restore";
    if (isOfPlaceholder) return PlaceholderEnds;
    if (record.scenario == "Vessik Sync") return RemovalEnds;
    if (!record.success) return InstallEnds;
    if (record.scenario != "Asset install") return std::nullopt;
    if (record.description == "assertion denied") return TerminationDenied;
    return record.description.starts_with("assertion ") ? std::optional(InstallBegins)
                                                        : std::nullopt;
}

std::optional<TimelineEventKind> kindOfStep(const HistoryRecord& record) {
    constexpr std::uint64_t kInstallStep = 1;
    constexpr std::uint64_t kPlaceholderStep = 4;
    if (record.step == kInstallStep && record.phase == 1) {
        return TimelineEventKind::PlaceholderBegins;
    }
    return record.step == kPlaceholderStep && record.phase == 2
               ? std::optional(TimelineEventKind::PlaceholderEnds)
               : std::nullopt;
}

/// Nothing where the record is of no interest here.
std::optional<TimelineEvent> eventOfHistory(const HistoryRecord& record) {
    const std::optional<TimelineEventKind> kind =
        record.kind == HistoryRecord::Kind::Scenario ? kindOfScenario(record) : kindOfStep(record);
    if (!kind) return std::nullopt;
    TimelineEvent event;
    event.kind = *kind;
    event.identifier = record.identifier;
    if (!record.success) event.detail = record.description;
    return event;
}

/// What is installed now, in a session of which nobody has told the end, was installed.
Status addOutcomes(Device& device, Timeline& timeline) {
    const Result<std::vector<ApplicationRecord>> applications = device.applications();
    if (!applications) return applications.error();
    std::set<std::string> installed;
    for (const ApplicationRecord& each : *applications) {
        if (!each.isPlaceholder) installed.insert(each.identifier);
    }
    for (const ApplicationRecord& each : *applications) {
        if (each.isPlaceholder) installed.erase(each.identifier);
    }
    for (TimelineLane& lane : timeline.lanes) {
        if (!isNotOver(lane) || !installed.contains(lane.identifier)) continue;
        lane.outcome = LaneOutcome::Installed;
        std::erase_if(lane.spans, [](const TimelineSpan& span) {
            return span.isOpen && span.kind == SpanKind::Turn;
        });
        for (TimelineSpan& span : lane.spans) span.isOpen = false;
    }
    std::erase_if(timeline.waits, [&](const TimelineWait& wait) {
        return wait.isOpen && installed.contains(wait.who);
    });
    return {};
}

}  // namespace

std::vector<TimedEvent> eventsBefore(const std::vector<HistoryRecord>& records,
                                     const std::optional<WallTime>& time) {
    TimedEvents events;
    std::optional<WallTime> next = time;
    for (auto record = records.rbegin(); record != records.rend(); ++record) {
        if (time && record->time >= *time) continue;
        // Either way, as the clock may have been set back between two sessions.
        if (next && std::chrono::abs(*next - record->time) > kBetweenSessions) break;
        next = record->time;
        std::optional<TimelineEvent> event = eventOfHistory(*record);
        if (event) events.push_back({record->time, *std::move(event)});
    }
    std::reverse(events.begin(), events.end());
    return events;
}

Result<Timeline> timelineOfDevice(Device& device, const std::string& shownName,
                                  const DeviceTimelineOptions& options) {
    Result<DeviceSession> session = sessionOf(device, options.session);
    if (!session) return session.error();
    Timeline timeline;
    timeline.source = "device " + shownName;
    if (session->events.empty()) return timeline;
    const WallTime began = session->events.front().time;
    WallTime end = session->events.back().time;
    if (session->goesOn && options.now) end = std::max(end, *options.now);
    TimelineBuilding building;
    for (TimedEvent& each : session->events) {
        each.event.at = each.time - began;
        building.add(std::move(each.event));
    }
    const std::string source = std::move(timeline.source);
    timeline = building.finish(end - began, session->goesOn);
    timeline.source = source;
    timeline.began = began;
    if (timeline.kind.empty()) timeline.kind = "session";
    std::move(session->notes.begin(), session->notes.end(), std::back_inserter(timeline.notes));
    Status added;
    if (options.session == 1) added = addReasons(device, timeline);
    if (added && session->isOfHistory && !session->goesOn) added = addOutcomes(device, timeline);
    if (!added) return added.error();
    return timeline;
}

}  // namespace appsync
