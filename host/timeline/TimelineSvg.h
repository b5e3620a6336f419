#pragma once

#include <string>
#include <string_view>

#include "host/timeline/Timeline.h"

namespace appsync {

/// The picture as an SVG document in UTF-8, light or dark as the viewer prefers. Whoever points at
/// something is shown its numbers. It needs nothing from elsewhere and runs nothing.
[[nodiscard]] std::string timelineSvg(const Timeline& timeline);

/// The text as content or as a quoted attribute's value in XML and in HTML; what no XML may hold
/// becomes "?".
[[nodiscard]] std::string escapedMarkup(std::string_view text);

}  // namespace appsync
