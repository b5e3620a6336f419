#pragma once

#include <string>
#include <vector>

#include "host/timeline/Timeline.h"

namespace appsync {

// What is told of a shape while somebody points at it: the numbers, a line each, safe to print.

[[nodiscard]] std::string titleOfSpan(const TimelineLane& lane, const TimelineSpan& span);
[[nodiscard]] std::string titleOfLane(const TimelineLane& lane);
[[nodiscard]] std::string titleOfPhase(const TimelinePhase& phase);
[[nodiscard]] std::string titleOfGroup(const std::vector<const TimelineLane*>& lanes);

/// "208 installed, 2 skipped"
[[nodiscard]] std::string outcomesOf(const std::vector<const TimelineLane*>& lanes);
[[nodiscard]] TimelineMoment meanLength(const std::vector<const TimelineLane*>& lanes);

}  // namespace appsync
