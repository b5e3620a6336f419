#pragma once

#include <cstdint>
#include <string_view>

#include "platform/Error.h"

namespace appsync {

/// How the command ends.
enum ExitStatus : int {
    kExitDone = 0,
    kExitSomethingFailed = 1,
    kExitWrongUsage = 2,
    kExitUnusable = 3,
};

/// Domain of errors that the command itself finds; their code is the exit status.
inline constexpr std::string_view kCommandErrorDomain = "appsync";

/// The command is right but could not do what it asks.
[[nodiscard]] ErrorRecord failure(std::string_view what, std::string_view whatToDo);
/// The command asks for something that it cannot mean.
[[nodiscard]] ErrorRecord wrongUsage(std::string_view what, std::string_view whatToDo);
/// The device or the library cannot be used.
[[nodiscard]] ErrorRecord unusable(std::string_view what, std::string_view whatToDo);
/// The same of an error that somebody else has found.
[[nodiscard]] ErrorRecord unusable(const ErrorRecord& cause);

/// The device has no room for `subject`.
[[nodiscard]] ErrorRecord lackOfSpace(std::string_view subject, std::uint64_t needed,
                                      std::uint64_t free, std::string_view whatToDo);

/// The exit status that the error asks for; `kExitSomethingFailed` for errors of other domains.
[[nodiscard]] ExitStatus exitStatusOf(const ErrorRecord& error);

}  // namespace appsync
