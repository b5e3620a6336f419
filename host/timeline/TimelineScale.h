#pragma once

#include <algorithm>
#include <string>
#include <vector>

#include "host/timeline/Timeline.h"

namespace appsync {

/// Where moments stand from left to right.
struct TimelineScale {
    double left = 0;
    double width = 1;
    TimelineMoment length{1};

    [[nodiscard]] double at(TimelineMoment moment) const {
        const double share = static_cast<double>(moment.count()) /
                             static_cast<double>(std::max<std::int64_t>(length.count(), 1));
        return left + width * std::clamp(share, 0.0, 1.0);
    }
};

struct TimelineTick {
    TimelineMoment at{0};
    std::string text;
};

/// At most ten moments that people count in, from 0 on.
[[nodiscard]] std::vector<TimelineTick> ticksOf(TimelineMoment length);

}  // namespace appsync
