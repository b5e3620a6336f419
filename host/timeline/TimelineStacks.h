#pragma once

#include <cstddef>
#include <vector>

#include "host/timeline/Timeline.h"
#include "host/timeline/TimelineDrawing.h"
#include "host/timeline/TimelineScale.h"

namespace appsync {

/// Where a stack of areas stands.
struct StackPlace {
    TimelineScale scale;
    double bottom = 0;
    double height = 0;
};

/// How many of the applications are in a span of each of the kinds, over time: areas on top of each
/// other, as high as the place where the most of them are in one.
[[nodiscard]] std::vector<AreaShape> stackedAreas(const std::vector<const TimelineLane*>& lanes,
                                                  const std::vector<SpanKind>& kinds,
                                                  const StackPlace& place);

}  // namespace appsync
