#pragma once

// host/timeline: what happened in one session, drawn: a lane for each application over time.
//
//     Timeline.h              what there is to draw (this header), as plain data
//     TimelineEvents.h        what a message of the plug-in tells of
//     TimelineBuilding.h      makes a timeline of such events
//     TimelineOfDevice.h      of a device's log and history; TimelineLog.h finds the sessions in it
//     TimelineOfRecording.h   of a recording
//     TimelineGroups.h        which lanes stand by themselves, and which are drawn together
//     TimelineLayout.h        where everything goes: shapes of a TimelineDrawing.h
//     TimelineSvg.h, TimelinePng.h, TimelinePage.h    the picture, and the page around it
//
// What a message means stands in TimelineEvents.cpp alone, so that a device's log and a recording
// of the same session tell the same. Changes nothing and writes no file. Called by the commands.

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace appsync {

/// A time since the session began.
using TimelineMoment = std::chrono::nanoseconds;

/// What an application's time goes by with.
enum class SpanKind {
    Placeholder,  // its placeholder is made
    Turn,         // it waits until others are transferred
    Transfer,
    Queue,        // it waits until others are installed
    Termination,  // it waits until it ends, as it runs
    Store,        // it waits for the app store
    Install,
    Removal,
};
inline constexpr std::size_t kSpanKinds = 8;

/// One stretch of an application's time.
struct TimelineSpan {
    SpanKind kind = SpanKind::Install;
    TimelineMoment begin{0};
    TimelineMoment end{0};
    /// It went on when the session was over, or what tells of it.
    bool isOpen = false;
    /// Of a recording the thread that began it; 0 where nobody knows.
    std::uint64_t thread = 0;

    [[nodiscard]] TimelineMoment length() const { return end - begin; }
};

/// What has become of an application.
enum class LaneOutcome {
    Open,      // nothing yet, or nobody has told
    Waiting,   // for what its last span says
    Restored,  // its placeholder stands; the package comes in another session
    Installed,
    Removed,
    Skipped,
    Cancelled,
    Failed,
};

/// One application.
struct TimelineLane {
    std::string identifier;
    std::string name;
    std::string version;
    /// When the session first spoke of it, and last.
    TimelineMoment asked{0};
    TimelineMoment end{0};
    std::vector<TimelineSpan> spans;  // in the order in which they began
    LaneOutcome outcome = LaneOutcome::Open;
    /// Why it was skipped, or has failed.
    std::string reason;

    [[nodiscard]] TimelineMoment length() const { return end - asked; }
    /// What it took itself, waits for other applications aside.
    [[nodiscard]] TimelineMoment ownTime() const;
};

/// What the whole session did, or what the host asked for.
struct TimelinePhase {
    std::string name;
    TimelineMoment begin{0};
    TimelineMoment end{0};
};

/// Somebody waited for something.
struct TimelineWait {
    /// The application; empty: the whole session.
    std::string who;
    /// "until others are transferred"
    std::string what;
    TimelineMoment begin{0};
    TimelineMoment end{0};
    bool isOpen = false;

    [[nodiscard]] TimelineMoment length() const { return end - begin; }
};

/// One session.
struct Timeline {
    /// "device demo", "recording first.jsonl"
    std::string source;
    /// "sync", "restore" or "send"; empty where there is none.
    std::string kind;
    /// Nobody knows it of a recording.
    std::optional<std::chrono::system_clock::time_point> began;
    TimelineMoment length{0};
    /// What a viewer has to know: that the session goes on, that its beginning is lost ...
    std::vector<std::string> notes;
    std::vector<TimelinePhase> phases;
    std::vector<TimelinePhase> calls;  // of the host, of a recording only
    std::vector<TimelineLane> lanes;   // in the order in which they were first spoken of
    std::vector<TimelineWait> waits;   // in the order in which they began

    /// There is no session to draw.
    [[nodiscard]] bool isEmpty() const { return kind.empty(); }
};

/// "transfer", "waits until others are installed".
[[nodiscard]] const char* nameOfSpan(SpanKind kind);
/// "installed"; with the reason where there is one: "failed: no such package".
[[nodiscard]] std::string outcomeText(const TimelineLane& lane);
[[nodiscard]] const char* nameOfOutcome(LaneOutcome outcome);
/// Whether somebody waits in a span of the kind.
[[nodiscard]] bool isWait(SpanKind kind);
/// Whether it is for other applications.
[[nodiscard]] bool isWaitForOthers(SpanKind kind);
/// Whether the application is one that somebody should look at.
[[nodiscard]] bool needsAttention(const TimelineLane& lane);
/// Whether nobody knows yet what becomes of the application.
[[nodiscard]] bool isNotOver(const TimelineLane& lane);
/// Both times; the longest that there is, where what tells of them is so wrong that it is shorter.
[[nodiscard]] TimelineMoment together(TimelineMoment left, TimelineMoment right);
/// "12 ms", "3.4 s", "2 min 5 s".
[[nodiscard]] std::string durationText(TimelineMoment length);
/// "5 applications: 4 installed, 1 failed".
[[nodiscard]] std::string sumOfOutcomes(const Timeline& timeline);
/// "sync of device demo, 2026-11-23 07:30:03 +0000, 1.2 s".
[[nodiscard]] std::string headingOf(const Timeline& timeline);
/// The lanes that took longest themselves, those that were skipped aside; the longest first.
[[nodiscard]] std::vector<const TimelineLane*> longestLanes(const Timeline& timeline,
                                                            std::size_t count);

/// Waits of the same kind, told once.
struct WaitSum {
    std::string what;
    std::size_t count = 0;
    TimelineMoment total{0};
    TimelineMoment longest{0};
    /// Who waited longest; empty: the session.
    std::string who;
    bool isOpen = false;
};
/// The longest in all first.
[[nodiscard]] std::vector<WaitSum> sumsOfWaits(const Timeline& timeline);

/// Applications that failed of the same.
struct FailureSum {
    std::string reason;
    std::vector<const TimelineLane*> lanes;
};
/// The most frequent first.
[[nodiscard]] std::vector<FailureSum> sumsOfFailures(const Timeline& timeline);

}  // namespace appsync
