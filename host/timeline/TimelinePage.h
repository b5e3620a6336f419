#pragma once

#include <string>

#include "host/timeline/Timeline.h"

namespace appsync {

/// A page that shows the picture, and below it the same in tables: every application, every phase,
/// every kind of wait. It needs nothing from elsewhere and runs nothing.
[[nodiscard]] std::string timelinePage(const Timeline& timeline);

}  // namespace appsync
