#include "host/timeline/Timeline.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <map>

#include "host/console/Text.h"

namespace appsync {
namespace {

constexpr std::array<const char*, kSpanKinds> kSpanNames = {
    "placeholder",       "waits for its turn",  "transfer", "waits for other installs",
    "waits, as it runs", "waits for the store", "install",  "removal"};

constexpr std::array<const char*, 8> kOutcomeNames = {
    "not over",  "waits", "placeholder restored", "installed", "removed", "skipped",
    "cancelled", "failed"};

std::string withUnit(double value, const char* unit) {
    constexpr std::size_t kLongest = 40;
    constexpr double kTwoDigits = 9.95;
    std::array<char, kLongest> text{};
    std::snprintf(text.data(), text.size(), value < kTwoDigits ? "%.1f %s" : "%.0f %s", value,
                  unit);
    return text.data();
}

void addTo(WaitSum& sum, const TimelineWait& wait) {
    ++sum.count;
    sum.total = together(sum.total, wait.length());
    sum.isOpen = sum.isOpen || wait.isOpen;
    if (sum.count > 1 && wait.length() <= sum.longest) return;
    sum.longest = wait.length();
    sum.who = wait.who;
}

}  // namespace

const char* nameOfSpan(SpanKind kind) { return kSpanNames.at(static_cast<std::size_t>(kind)); }

const char* nameOfOutcome(LaneOutcome outcome) {
    return kOutcomeNames.at(static_cast<std::size_t>(outcome));
}

std::string outcomeText(const TimelineLane& lane) {
    const std::string text = nameOfOutcome(lane.outcome);
    if (!lane.reason.empty()) return text + ": " + lane.reason;
    const bool tellsWait = lane.outcome == LaneOutcome::Waiting && !lane.spans.empty();
    return tellsWait ? nameOfSpan(lane.spans.back().kind) : text;
}

bool isWait(SpanKind kind) {
    return kind == SpanKind::Turn || kind == SpanKind::Queue || kind == SpanKind::Termination ||
           kind == SpanKind::Store;
}

bool isWaitForOthers(SpanKind kind) { return kind == SpanKind::Turn || kind == SpanKind::Queue; }

TimelineMoment TimelineLane::ownTime() const {
    TimelineMoment time{0};
    for (const TimelineSpan& span : spans) {
        if (!isWaitForOthers(span.kind)) time = together(time, span.length());
    }
    return time;
}

bool needsAttention(const TimelineLane& lane) {
    return lane.outcome == LaneOutcome::Failed || lane.outcome == LaneOutcome::Cancelled;
}

bool isNotOver(const TimelineLane& lane) {
    return lane.outcome == LaneOutcome::Open || lane.outcome == LaneOutcome::Waiting;
}

TimelineMoment together(TimelineMoment left, TimelineMoment right) {
    const TimelineMoment longest = TimelineMoment::max();
    return right > longest - left ? longest : left + right;
}

std::string durationText(TimelineMoment length) {
    using std::chrono::duration;
    using std::chrono::duration_cast;
    const double seconds = duration<double>(length).count();
    if (seconds < 0.001) return withUnit(seconds * 1e6, "\xC2\xB5s");
    if (seconds < 1) return withUnit(seconds * 1e3, "ms");
    if (seconds < 100) return withUnit(seconds, "s");
    const auto whole = duration_cast<std::chrono::seconds>(length).count();
    if (whole < 3600)
        return std::to_string(whole / 60) + " min " + std::to_string(whole % 60) + " s";
    return std::to_string(whole / 3600) + " h " + std::to_string(whole / 60 % 60) + " min";
}

std::string sumOfOutcomes(const Timeline& timeline) {
    std::map<LaneOutcome, std::size_t> counts;
    for (const TimelineLane& lane : timeline.lanes) ++counts[lane.outcome];
    std::string text = counted(timeline.lanes.size(), "application");
    const char* separator = ": ";
    for (const auto& [outcome, count] : counts) {
        text += separator + std::to_string(count) + ' ' + nameOfOutcome(outcome);
        separator = ", ";
    }
    return text;
}

std::string headingOf(const Timeline& timeline) {
    if (timeline.isEmpty()) return timeline.source;
    std::string text = timeline.kind + " of " + timeline.source;
    if (timeline.began) text += ", " + formatLocalTime(*timeline.began);
    return text + ", " + durationText(timeline.length);
}

std::vector<const TimelineLane*> longestLanes(const Timeline& timeline, std::size_t count) {
    std::vector<const TimelineLane*> lanes;
    lanes.reserve(timeline.lanes.size());
    for (const TimelineLane& lane : timeline.lanes) {
        if (lane.outcome != LaneOutcome::Skipped) lanes.push_back(&lane);
    }
    std::stable_sort(lanes.begin(), lanes.end(), [](const auto* left, const auto* right) {
        return left->ownTime() > right->ownTime();
    });
    if (lanes.size() > count) lanes.resize(count);
    return lanes;
}

std::vector<WaitSum> sumsOfWaits(const Timeline& timeline) {
    std::map<std::string, WaitSum> byWhat;
    for (const TimelineWait& wait : timeline.waits) {
        WaitSum& sum = byWhat[wait.what];
        sum.what = wait.what;
        addTo(sum, wait);
    }
    std::vector<WaitSum> sums;
    sums.reserve(byWhat.size());
    for (auto& [what, sum] : byWhat) sums.push_back(std::move(sum));
    std::stable_sort(sums.begin(), sums.end(), [](const WaitSum& left, const WaitSum& right) {
        return left.total > right.total;
    });
    return sums;
}

std::vector<FailureSum> sumsOfFailures(const Timeline& timeline) {
    std::map<std::string, FailureSum> byReason;
    for (const TimelineLane& lane : timeline.lanes) {
        if (!needsAttention(lane)) continue;
        FailureSum& sum = byReason[outcomeText(lane)];
        sum.reason = outcomeText(lane);
        sum.lanes.push_back(&lane);
    }
    std::vector<FailureSum> sums;
    sums.reserve(byReason.size());
    for (auto& [reason, sum] : byReason) sums.push_back(std::move(sum));
    std::stable_sort(sums.begin(), sums.end(), [](const FailureSum& left, const FailureSum& right) {
        return left.lanes.size() > right.lanes.size();
    });
    return sums;
}

}  // namespace appsync
