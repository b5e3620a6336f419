#pragma once

// host/command/look: the commands that show a device and leave it as it is. LogLines.h is a part of
// LogCommand.cpp. Called by host/command only.

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "platform/LogFacility.h"

namespace appsync {

struct Console;

[[nodiscard]] int runApps(const std::string& device, bool asJson, const Console& console);
[[nodiscard]] int runWhy(const std::string& device, const std::string& identifier, bool asJson,
                         const Console& console);
[[nodiscard]] int runInventory(const std::string& device, bool asJson, const Console& console);
[[nodiscard]] int runStatus(const std::string& device, bool asJson, const Console& console);

struct HistoryArguments {
    std::string device;
    /// Only what happened to this application.
    std::optional<std::string> application;
    bool asJson = false;
};
[[nodiscard]] int runHistory(const HistoryArguments& arguments, const Console& console);

[[nodiscard]] int runScreen(const std::string& device, const std::string& picture, bool asJson,
                            const Console& console);

// TimelineCommand.cpp

struct TimelineArguments {
    /// A device, or a recording.
    std::string source;
    std::string picture;
    /// Which of a device's sessions, counted back; nothing: the last.
    std::optional<std::size_t> session;
    bool asJson = false;
};
[[nodiscard]] int runTimeline(const TimelineArguments& arguments, const Console& console);

// ServeCommand.cpp

struct ServeArguments {
    /// A device, or a folder of devices.
    std::string place;
    /// 0: one that is free.
    std::uint16_t port = 8017;
    /// The command's.
    std::string version;
};
[[nodiscard]] int runServe(const ServeArguments& arguments, const Console& console);

// DiffCommand.cpp

[[nodiscard]] int runDiff(const std::string& left, const std::string& right, bool asJson,
                          const Console& console);

// LogCommand.cpp

struct LogArguments {
    std::string device;
    std::optional<int> category;
    /// This level and those above it.
    std::optional<LogLevel> level;
    /// Only lines that name this application.
    std::optional<std::string> application;
    /// Only so many lines, the last ones.
    std::optional<std::size_t> last;
    bool follows = false;
    bool asJson = false;
};
[[nodiscard]] int runLog(const LogArguments& arguments, const Console& console);

}  // namespace appsync
