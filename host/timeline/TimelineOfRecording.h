#pragma once

#include <string>

#include "host/replay/RecordingReader.h"
#include "host/timeline/Timeline.h"

namespace appsync {

/// The session that a recording holds: what the plug-in has logged, and the host's calls.
[[nodiscard]] Timeline timelineOfRecording(const RecordedSession& session,
                                           const std::string& shownName);

}  // namespace appsync
