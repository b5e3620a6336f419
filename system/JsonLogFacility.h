#pragma once

// system: the parts of a platform that any device on POSIX can use, each one service of platform/
// or what several need:
//
//     log             JsonLogFacility.h, over LogFile.h, which bounds it
//     notifications   SystemNotifications.h
//     registry        RegistryObservers.h, which calls those who observe one, and
//                     MemoryProgressRecord.h
//     accounts        ActingAccount.h
//     memory          AllocatorTuning.h
//     file/, threads/, property_list/  files, work, both encodings: rooms of their own
//
// Includes platform/ and POSIX; knows no device, no database, no plug-in. Called by device/ and
// host/; a port to another POSIX device takes it as it is (docs/porting.md).

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/LogFacility.h"
#include "system/LogFile.h"

namespace appsync {

/// One rendered message. The texts live for the duration of the call that gets it.
struct LogLine {
    std::chrono::system_clock::time_point time;
    LogCategory category = LogCategory::General;
    LogLevel level = LogLevel::Default;
    std::string_view message;
    std::string_view format;
};

/// The name of a level in a log: "default", "info", "debug", "error" or "fault".
[[nodiscard]] std::string_view nameOf(LogLevel level) noexcept;

/// The line as one JSON object without a line end: "time" (ISO 8601, UTC, microseconds), "category"
/// (the number), "level" (the name), "message", "format". Bytes that are not UTF-8 become U+FFFD.
[[nodiscard]] std::string toJson(const LogLine& line);

/// A log that appends one JSON object a line to a file, which several processes may share. Callable
/// on any thread; nothing throws. A message that cannot be written is dropped and counted; before
/// the next one that can be, the log says how many were, and why.
class JsonLogFacility : public LogFacility {
  public:
    /// Gets each message, on the thread that logs it, one call at a time. It must not log.
    using Listener = std::function<void(const LogLine& line)>;

    explicit JsonLogFacility(LogFile file) : file_(std::move(file)) {}

    void write(const LogMessage& message) noexcept override;
    [[nodiscard]] std::unique_ptr<LogHandle> makeHandle(std::string_view subsystem,
                                                        std::string_view category) override;

    /// From now on the listener gets each message; an empty one gets none. No call of the previous
    /// listener is under way when this returns.
    void setListener(Listener listener);

    /// Messages that were dropped, and the reason of the last of them.
    struct Loss {
        std::uint64_t messages = 0;
        std::string reason;
    };
    [[nodiscard]] Loss loss() const;

  private:
    void append(const LogMessage& message);
    void tellListener(const LogLine& line) const;
    bool tellLoss();
    void drop(int error);

    mutable std::mutex mutex_;
    // Protected by mutex_.
    LogFile file_;
    Listener listener_;
    std::uint64_t dropped_ = 0;
    std::uint64_t toldDropped_ = 0;  // as many of them as the log tells of
    int lastError_ = 0;
};

}  // namespace appsync
