#pragma once

#include <cstddef>
#include <optional>
#include <string>

#include "host/output/LogRecord.h"
#include "platform/Result.h"

namespace appsync {

/// Which lines of a log are asked for.
struct LogQuestion {
    LogFilter filter;
    /// Those behind this position, as an earlier answer has given it; without one, the last.
    std::optional<std::string> after;
    std::size_t most = 200;
};

/// The lines as they stand in the log, each with its position, and the position behind what was
/// read: {"lines": [...], "next": "..."}. A position stays good when the log is put aside.
[[nodiscard]] Result<std::string> logText(const std::string& path, const LogQuestion& question);

}  // namespace appsync
