#pragma once

#include <vector>

#include "host/timeline/Timeline.h"

namespace appsync {

/// Lanes under one heading, or drawn as one.
struct LaneGroup {
    std::string heading;
    std::vector<const TimelineLane*> lanes;
};

/// Which lanes stand by themselves, and which are drawn together.
struct GroupedLanes {
    /// Each of their lanes is drawn.
    std::vector<LaneGroup> single;
    /// Each of these is drawn as one lane.
    std::vector<LaneGroup> together;
};

/// How many lanes a picture has at the most, whatever the number of applications: single ones, and
/// groups of the rest.
inline constexpr std::size_t kMostSingleLanes = 120;
inline constexpr std::size_t kMostGroups = 20;

/// What failed, what is not over and what took longest stands by itself, as far as there is room;
/// everything does where the applications are few. The lanes stay those of the timeline.
[[nodiscard]] GroupedLanes groupedLanes(const Timeline& timeline);

}  // namespace appsync
