#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string_view>
#include <variant>

namespace appsync {

class PropertyList;
struct ErrorRecord;

enum class LogLevel { Default, Info, Debug, Error, Fault };

/// The SyncHost's log categories that the plug-in writes to.
enum class LogCategory : int { General = 0, Coordination = 8, Applications = 14 };

/// One argument of a message, borrowed for the duration of the call. `nullptr` is the missing
/// object and is rendered "(null)"; an integer is one whatever its width; %c takes the character's
/// code.
using LogArgument = std::variant<std::nullptr_t, std::int64_t, std::uint64_t, double,
                                 std::string_view, const PropertyList*, const ErrorRecord*>;

/// A message that is not rendered yet: its format text exactly as the system gives it, and the
/// arguments for its place-holders, in order, of matching kinds (checked when the caller compiled).
///
/// Place-holders: %s and %{public}@ (string, property list, error or null), %d %ld %lld (signed),
/// %u %lu %llu (unsigned), %f %lf (real), %c (character), each as in C; %% stands for a per cent
/// sign.
struct LogMessage {
    LogCategory category;
    LogLevel level;
    std::string_view format;
    std::span<const LogArgument> arguments;
};

/// A log of one subsystem and category beside the host's own categories.
class LogHandle {
  public:
    virtual ~LogHandle() = default;
};

/// The SyncHost's log facility: it renders messages and keeps them.
/// Called by any thread at any time, the destructor of the client included. Never fails visibly,
/// never blocks for long, never calls back.
class LogFacility {
  public:
    virtual ~LogFacility() = default;

    virtual void write(const LogMessage& message) noexcept = 0;

    /// A handle for a subsystem's own category. The caller owns it and releases it when handed on.
    [[nodiscard]] virtual std::unique_ptr<LogHandle> makeHandle(std::string_view subsystem,
                                                                std::string_view category) = 0;
};

}  // namespace appsync
