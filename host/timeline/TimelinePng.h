#pragma once

#include "host/timeline/Timeline.h"
#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

/// How many pixels of a PNG stand for one of the picture, in each direction.
inline constexpr double kTimelinePixels = 2;

/// The picture as a PNG, on light ground. Fails when memory runs out.
[[nodiscard]] Result<Bytes> timelinePng(const Timeline& timeline);

}  // namespace appsync
