#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/LogFacility.h"

namespace appsync {

/// What a line of a device's log says; empty where it says nothing, or something else than a text.
struct LogRecord {
    std::string time;
    std::string level;
    std::string message;
    std::optional<std::int64_t> category;
};

/// Reads a line; nothing where it is none of a log.
[[nodiscard]] std::optional<LogRecord> readLogLine(std::string_view line);

/// Which messages are wanted; without anything, all of them.
struct LogFilter {
    std::optional<std::int64_t> category{};
    /// This level and those above it.
    std::optional<LogLevel> level{};
    /// Those that name this application.
    std::optional<std::string> application{};
    /// Those that hold this text, whatever its case.
    std::optional<std::string> text{};
};
[[nodiscard]] bool isWanted(const LogRecord& record, const LogFilter& filter);

/// Whether the text names the application, and not only one whose identifier holds that one.
[[nodiscard]] bool namesApplication(std::string_view text, std::string_view identifier);

/// The level that has this name in a log.
[[nodiscard]] std::optional<LogLevel> levelNamed(std::string_view name);

}  // namespace appsync
