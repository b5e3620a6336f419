#include "host/timeline/TimelineTitles.h"

#include <algorithm>
#include <array>

#include "host/console/Text.h"
#include "host/timeline/TimelineDrawing.h"

namespace appsync {
namespace {

constexpr std::size_t kTitleCharacters = 260;
constexpr std::size_t kOutcomes = static_cast<std::size_t>(LaneOutcome::Failed) + 1;

std::string fromTo(TimelineMoment begin, TimelineMoment end) {
    return "from " + durationText(begin) + " to " + durationText(end);
}

/// How long the applications spent in spans of each kind, a line each.
std::string timesOfKinds(const std::vector<const TimelineLane*>& lanes) {
    std::array<TimelineMoment, kSpanKinds> totals{};
    std::array<TimelineMoment, kSpanKinds> longest{};
    for (const TimelineLane* lane : lanes) {
        for (const TimelineSpan& span : lane->spans) {
            const auto kind = static_cast<std::size_t>(span.kind);
            totals.at(kind) = together(totals.at(kind), span.length());
            longest.at(kind) = std::max(longest.at(kind), span.length());
        }
    }
    std::string text;
    for (std::size_t kind = 0; kind < kSpanKinds; ++kind) {
        if (totals.at(kind).count() == 0) continue;
        text += std::string("\n") + nameOfSpan(static_cast<SpanKind>(kind)) + ": " +
                durationText(totals.at(kind)) + " in all, longest " +
                durationText(longest.at(kind));
    }
    return text;
}

}  // namespace

std::string titleOfSpan(const TimelineLane& lane, const TimelineSpan& span) {
    std::string title = shortened(lane.identifier, kTitleCharacters) + "\n" +
                        nameOfSpan(span.kind) + ": " + durationText(span.length()) +
                        (span.isOpen ? ", and it goes on\n" : "\n") + fromTo(span.begin, span.end);
    if (span.thread != 0) title += "\nbegun by thread " + std::to_string(span.thread);
    return title;
}

std::string titleOfLane(const TimelineLane& lane) {
    std::string title = shortened(lane.identifier, kTitleCharacters);
    if (!lane.name.empty()) title += "\n" + shortened(lane.name, kTitleCharacters);
    if (!lane.version.empty()) title += " " + shortened(lane.version, kTitleCharacters);
    return title + "\n" + shortened(outcomeText(lane), kTitleCharacters) + "\n" +
           durationText(lane.length()) + ", asked for at " + durationText(lane.asked);
}

std::string titleOfPhase(const TimelinePhase& phase) {
    return shortened(phase.name, kTitleCharacters) + ": " + durationText(phase.end - phase.begin) +
           "\n" + fromTo(phase.begin, phase.end);
}

std::string titleOfGroup(const std::vector<const TimelineLane*>& lanes) {
    return counted(lanes.size(), "application") + ": " + outcomesOf(lanes) + "\non average " +
           durationText(meanLength(lanes)) + timesOfKinds(lanes) +
           "\nabove what is done, below what waits; each as high as the most at once";
}

std::string outcomesOf(const std::vector<const TimelineLane*>& lanes) {
    std::array<std::size_t, kOutcomes> counts{};
    for (const TimelineLane* lane : lanes) ++counts.at(static_cast<std::size_t>(lane->outcome));
    std::string text;
    for (std::size_t i = 0; i < kOutcomes; ++i) {
        if (counts.at(i) == 0) continue;
        text += (text.empty() ? "" : ", ") + std::to_string(counts.at(i)) + " " +
                nameOfOutcome(static_cast<LaneOutcome>(i));
    }
    return text;
}

TimelineMoment meanLength(const std::vector<const TimelineLane*>& lanes) {
    TimelineMoment total{0};
    for (const TimelineLane* lane : lanes) total = together(total, lane->length());
    return lanes.empty() ? total : total / static_cast<std::int64_t>(lanes.size());
}

}  // namespace appsync
