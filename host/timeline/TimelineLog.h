#pragma once

#include <optional>
#include <string_view>
#include <vector>

#include "host/timeline/TimelineEvents.h"

namespace appsync {

/// A line of a device's log that tells of something.
struct LoggedMessage {
    std::string_view line;
    const TimelineMessage* message = nullptr;
};

/// The lines of one session.
struct LoggedSession {
    std::vector<LoggedMessage> lines;
    /// They are the first of the log, and nothing says that the session began there.
    bool lacksBeginning = false;
};

/// The sessions that a log tells of, in order. What is no line of a log counts for nothing. The
/// lines stay those of `text`.
[[nodiscard]] std::vector<LoggedSession> sessionsInLog(std::string_view text);

/// What a line tells of, and when; nothing where the line is damaged.
[[nodiscard]] std::optional<TimedEvent> eventOfLine(const LoggedMessage& line);

}  // namespace appsync
