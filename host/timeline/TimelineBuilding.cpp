#include "host/timeline/TimelineBuilding.h"

#include <algorithm>
#include <utility>

namespace appsync {
namespace {

using enum TimelineEventKind;

std::string awaitedIn(SpanKind kind) {
    switch (kind) {
        case SpanKind::Turn:
            return "its turn, as one application is transferred after another";
        case SpanKind::Queue:
            return "other installs, as only some go on at once";
        case SpanKind::Termination:
            return "its own end, as it was running";
        case SpanKind::Store:
            return "the app store, which brings its package";
        default:
            return {};
    }
}

TimelineSpan* openSpan(TimelineLane& lane, SpanKind kind) {
    for (auto span = lane.spans.rbegin(); span != lane.spans.rend(); ++span) {
        if (span->kind == kind && span->isOpen) return &*span;
    }
    return nullptr;
}

void beginSpan(TimelineLane& lane, SpanKind kind, TimelineMoment at, std::uint64_t thread) {
    if (openSpan(lane, kind) != nullptr) return;
    lane.spans.push_back({kind, at, at, true, thread});
}

void endSpan(TimelineLane& lane, SpanKind kind, TimelineMoment at) {
    TimelineSpan* span = openSpan(lane, kind);
    if (span == nullptr) return;
    span->end = at;
    span->isOpen = false;
}

void endAllSpans(TimelineLane& lane, TimelineMoment at) {
    for (TimelineSpan& span : lane.spans) {
        if (!span.isOpen) continue;
        span.end = at;
        span.isOpen = false;
    }
}

void endLane(TimelineLane& lane, LaneOutcome outcome, const TimelineEvent& event) {
    endAllSpans(lane, event.at);
    lane.outcome = outcome;
    lane.reason = event.detail;
    lane.end = event.at;
}

void endLaneWell(TimelineLane& lane, LaneOutcome outcome, const TimelineEvent& event) {
    endLane(lane, event.detail.empty() ? outcome : LaneOutcome::Failed, event);
}

/// What it asks for again is not over.
void reopenLane(TimelineLane& lane) {
    lane.outcome = LaneOutcome::Open;
    lane.reason.clear();
}

/// Since when nothing keeps it from being transferred but others.
TimelineMoment readyAt(const TimelineLane& lane) {
    TimelineMoment ready = lane.asked;
    for (const TimelineSpan& span : lane.spans) ready = std::max(ready, span.end);
    return ready;
}

bool holdsSpan(const TimelineLane& lane, SpanKind kind) {
    return std::any_of(lane.spans.begin(), lane.spans.end(),
                       [kind](const TimelineSpan& span) { return span.kind == kind; });
}

/// It was asked for, and nothing has come after its placeholder.
bool awaitsTurn(const TimelineLane& lane) {
    return lane.outcome == LaneOutcome::Open &&
           std::all_of(lane.spans.begin(), lane.spans.end(),
                       [](const TimelineSpan& span) { return span.kind == SpanKind::Placeholder; });
}

}  // namespace

void TimelineBuilding::add(TimelineEvent event) {
    event.at = std::max(event.at, last_);
    last_ = event.at;
    if (isOfSession(event.kind)) {
        addToSession(event);
    } else if (!event.identifier.empty()) {
        addToLane(event);
    }
}

Timeline TimelineBuilding::finish(TimelineMoment length, bool goesOn) {
    timeline_.length = std::max(length, last_);
    if (!timeline_.phases.empty() && !isOver_) timeline_.phases.back().end = timeline_.length;
    for (TimelineLane& lane : timeline_.lanes) finishLane(lane, goesOn && !isOver_);
    gatherWaits();
    return std::move(timeline_);
}

void TimelineBuilding::addToSession(const TimelineEvent& event) {
    switch (event.kind) {
        case SyncBegins:
            beginSession("sync");
            return beginPhase("reconcile", event.at);
        case RestoreBegins:
            beginSession("restore");
            return beginPhase("restore", event.at);
        case ReconciliationEnds:
            reconciled_ = event.at;
            return;
        case InventoryBegins:
            return beginPhase("list", event.at);
        case AskingBegins:
            transfersFreeAt_ = event.at;
            return beginPhase("ask, placeholders", event.at);
        case RegistryAsked:
            sessionWait_ = TimelineWait{"", "the registry to say what is under way", event.at};
            return;
        case PlaceholdersAwaited:
            sessionWait_ = TimelineWait{"", "placeholders to be installed", event.at};
            return;
        case RegistryAnswered:
        case PlaceholdersThere:
            if (!sessionWait_) return;
            sessionWait_->end = event.at;
            timeline_.waits.push_back(*std::exchange(sessionWait_, std::nullopt));
            return;
        case TransfersEnd:
            return beginPhase("last installs", event.at);
        case SessionEnds:
            if (!timeline_.phases.empty()) timeline_.phases.back().end = event.at;
            isOver_ = true;
            return;
        default:
            return;
    }
}

void TimelineBuilding::addToLane(const TimelineEvent& event) {
    TimelineLane& lane = laneOf(event);
    switch (event.kind) {
        case Asked:
            reopenLane(lane);
            if (!event.detail.empty()) lane.name = event.detail;
            if (!event.version.empty()) lane.version = event.version;
            transfersFreeAt_ = event.at;
            return;
        case DeliveryBegins:
            beginSession("send");
            transfersFreeAt_ = event.at;
            return;
        case Skipped:
            return endLane(lane, LaneOutcome::Skipped, event);
        case PlaceholderBegins:
            return beginSpan(lane, SpanKind::Placeholder, event.at, event.thread);
        case PlaceholderEnds:
        case PlaceholderFails:
            return endPlaceholder(lane, event);
        case Cancelled:
            return endLane(lane, LaneOutcome::Cancelled, event);
        case RemovalBegins:
            return beginSpan(lane, SpanKind::Removal, event.at, event.thread);
        case RemovalEnds:
            return endLaneWell(lane, LaneOutcome::Removed, event);
        case TransferGoesOn:
        case TransferEnds:
            return addToTransfer(lane, event);
        default:
            return addToInstall(lane, event);
    }
}

void TimelineBuilding::addToTransfer(TimelineLane& lane, const TimelineEvent& event) {
    beginTransfer(lane, event);
    if (event.kind != TransferEnds) return;
    endSpan(lane, SpanKind::Transfer, event.at);
    transfersFreeAt_ = event.at;
    if (!event.detail.empty()) endLane(lane, LaneOutcome::Failed, event);
}

void TimelineBuilding::addToInstall(TimelineLane& lane, const TimelineEvent& event) {
    switch (event.kind) {
        case InstallQueued:
            endSpan(lane, SpanKind::Termination, event.at);
            return beginSpan(lane, SpanKind::Queue, event.at, event.thread);
        case InstallBegins:
            endSpan(lane, SpanKind::Queue, event.at);
            return beginSpan(lane, SpanKind::Install, event.at, event.thread);
        case TerminationDenied:
            // The install has not got further than to ask.
            if (TimelineSpan* span = openSpan(lane, SpanKind::Install)) {
                span->kind = SpanKind::Termination;
                return;
            }
            return beginSpan(lane, SpanKind::Termination, event.at, event.thread);
        case StoreAwaited:
            return beginSpan(lane, SpanKind::Store, event.at, event.thread);
        case InstallEnds:
            return endLaneWell(lane, LaneOutcome::Installed, event);
        default:
            return;
    }
}

void TimelineBuilding::beginSession(const char* kind) {
    if (timeline_.kind.empty()) timeline_.kind = kind;
}

void TimelineBuilding::beginPhase(const char* name, TimelineMoment at) {
    if (!timeline_.phases.empty()) {
        at = std::max(at, timeline_.phases.back().begin);
        timeline_.phases.back().end = at;
    }
    timeline_.phases.push_back({name, at, at});
}

// Nothing tells that a transfer begins: the host begins one when it is through with the one before.
void TimelineBuilding::beginTransfer(TimelineLane& lane, const TimelineEvent& event) {
    if (openSpan(lane, SpanKind::Transfer) != nullptr) return;
    beginSession("send");
    const TimelineMoment ready = readyAt(lane);
    const TimelineMoment begin = std::clamp(transfersFreeAt_, std::min(ready, event.at), event.at);
    if (timeline_.phases.empty() || timeline_.phases.back().name == "ask, placeholders") {
        beginPhase("transfer", begin);
    }
    reopenLane(lane);
    if (begin > ready) lane.spans.push_back({SpanKind::Turn, ready, begin, false, 0});
    beginSpan(lane, SpanKind::Transfer, begin, event.thread);
}

void TimelineBuilding::endPlaceholder(TimelineLane& lane, const TimelineEvent& event) {
    if (event.kind == PlaceholderFails && event.detail.empty()) return;  // it has not
    endSpan(lane, SpanKind::Placeholder, event.at);
    transfersFreeAt_ = event.at;
    if (!event.detail.empty()) endLane(lane, LaneOutcome::Failed, event);
}

TimelineLane& TimelineBuilding::laneOf(const TimelineEvent& event) {
    const auto [found, isNew] = lanes_.try_emplace(event.identifier, timeline_.lanes.size());
    if (isNew) {
        timeline_.lanes.emplace_back();
        timeline_.lanes.back().identifier = event.identifier;
        timeline_.lanes.back().asked = event.at;
    }
    return timeline_.lanes[found->second];
}

void TimelineBuilding::finishLane(TimelineLane& lane, bool goesOn) {
    const TimelineMoment end = timeline_.length;
    // A removal on the device's own path is told of only where it has failed.
    const TimelineSpan* removal = openSpan(lane, SpanKind::Removal);
    if (removal != nullptr && reconciled_ >= removal->begin && !goesOn) {
        TimelineEvent removed;
        removed.at = reconciled_;
        endLane(lane, LaneOutcome::Removed, removed);
    }
    if (lane.outcome != LaneOutcome::Open) return;
    const bool isRestored = timeline_.kind == "restore" && holdsSpan(lane, SpanKind::Placeholder) &&
                            openSpan(lane, SpanKind::Placeholder) == nullptr && awaitsTurn(lane);
    if (isRestored) {
        lane.outcome = LaneOutcome::Restored;
        lane.end = readyAt(lane);
        return;
    }
    if (awaitsTurn(lane) && openSpan(lane, SpanKind::Placeholder) == nullptr) {
        lane.spans.push_back({SpanKind::Turn, std::min(readyAt(lane), end), end, true, 0});
    }
    lane.end = end;
    for (TimelineSpan& span : lane.spans) {
        if (span.isOpen) span.end = end;
    }
    const bool waits =
        !lane.spans.empty() && lane.spans.back().isOpen && isWait(lane.spans.back().kind);
    if (waits) lane.outcome = LaneOutcome::Waiting;
}

void TimelineBuilding::gatherWaits() {
    if (sessionWait_) {
        sessionWait_->end = timeline_.length;
        sessionWait_->isOpen = true;
        timeline_.waits.push_back(*sessionWait_);
    }
    for (const TimelineLane& lane : timeline_.lanes) {
        for (const TimelineSpan& span : lane.spans) {
            if (!isWait(span.kind)) continue;
            timeline_.waits.push_back(
                {lane.identifier, awaitedIn(span.kind), span.begin, span.end, span.isOpen});
        }
    }
    std::stable_sort(timeline_.waits.begin(), timeline_.waits.end(),
                     [](const TimelineWait& left, const TimelineWait& right) {
                         return left.begin < right.begin;
                     });
}

}  // namespace appsync
