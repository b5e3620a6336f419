#pragma once

#include "host/timeline/Timeline.h"
#include "host/timeline/TimelineDrawing.h"

namespace appsync {

/// The picture of a timeline: what it is, what the signs mean, the phases of the session, a lane
/// for each application or group of them, what waited for what, and the five longest.
[[nodiscard]] TimelineDrawing layOutTimeline(const Timeline& timeline);

}  // namespace appsync
