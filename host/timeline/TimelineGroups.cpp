#include "host/timeline/TimelineGroups.h"

#include <algorithm>
#include <functional>
#include <set>

namespace appsync {
namespace {

constexpr std::size_t kMostOfAHeading = 20;
constexpr std::size_t kLongestShown = 10;
constexpr std::size_t kFewestOfAGroup = 20;

using LaneSet = std::set<const TimelineLane*>;

LaneGroup allOf(const Timeline& timeline, const char* heading,
                const std::function<bool(const TimelineLane&)>& isWanted) {
    LaneGroup group{heading, {}};
    group.lanes.reserve(timeline.lanes.size());
    for (const TimelineLane& lane : timeline.lanes) {
        if (isWanted(lane)) group.lanes.push_back(&lane);
    }
    return group;
}

/// The longest of a group, as many as have room, in their order; the rest stays in the group.
LaneGroup takeLongest(LaneGroup& group, std::size_t most) {
    std::vector<const TimelineLane*> byLength = group.lanes;
    std::stable_sort(byLength.begin(), byLength.end(), [](const auto* left, const auto* right) {
        return left->ownTime() > right->ownTime();
    });
    if (byLength.size() > most) byLength.resize(most);
    const LaneSet taken(byLength.begin(), byLength.end());
    LaneGroup longest{group.heading, {}};
    longest.lanes.reserve(taken.size());
    std::vector<const TimelineLane*> rest;
    rest.reserve(group.lanes.size());
    for (const TimelineLane* lane : group.lanes) {
        (taken.contains(lane) ? longest.lanes : rest).push_back(lane);
    }
    group.lanes = std::move(rest);
    return longest;
}

/// Equal parts, none of a few only, each of lanes that follow each other.
void addParts(std::vector<LaneGroup>& groups, const LaneGroup& whole, std::size_t most) {
    const std::size_t count = whole.lanes.size();
    const std::size_t enough = (count + kFewestOfAGroup - 1) / kFewestOfAGroup;
    const std::size_t parts = std::min(most, enough);
    groups.reserve(groups.size() + parts);
    for (std::size_t part = 0; part < parts; ++part) {
        const auto begin = static_cast<std::ptrdiff_t>(part * count / parts);
        const auto end = static_cast<std::ptrdiff_t>((part + 1) * count / parts);
        groups.push_back({whole.heading, {whole.lanes.begin() + begin, whole.lanes.begin() + end}});
    }
}

}  // namespace

GroupedLanes groupedLanes(const Timeline& timeline) {
    GroupedLanes grouped;
    if (timeline.lanes.size() <= kMostSingleLanes) {
        grouped.single.push_back(allOf(timeline, "", [](const TimelineLane&) { return true; }));
        return grouped;
    }
    LaneGroup failed = allOf(timeline, "Failed or cancelled", needsAttention);
    LaneGroup open = allOf(timeline, "Not over", isNotOver);
    LaneGroup rest = allOf(timeline, "All others", [](const TimelineLane& lane) {
        return !needsAttention(lane) && !isNotOver(lane);
    });
    for (LaneGroup* group : {&failed, &open}) {
        LaneGroup shown = takeLongest(*group, kMostOfAHeading);
        if (!shown.lanes.empty()) grouped.single.push_back(std::move(shown));
    }
    LaneGroup longest = takeLongest(rest, kLongestShown);
    longest.heading = "Took longest of all others";
    if (!longest.lanes.empty()) grouped.single.push_back(std::move(longest));
    failed.heading = "Also failed or cancelled";
    open.heading = "Also not over";
    addParts(grouped.together, failed, 1);
    addParts(grouped.together, open, 2);
    addParts(grouped.together, rest, kMostGroups - grouped.together.size());
    return grouped;
}

}  // namespace appsync
