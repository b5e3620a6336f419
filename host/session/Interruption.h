#pragma once

#include <chrono>
#include <string>
#include <string_view>

namespace appsync {

struct Console;

/// How long a session that is asked to stop may take to end in order.
inline constexpr std::chrono::seconds kPatience{3};

/// What a person does after an interruption.
inline constexpr std::string_view kRunAgain =
    "run the same command again to bring the device in step";

/// What is said when a session is asked to stop.
[[nodiscard]] std::string stoppingNotice();

/// Ends the process in the middle of what it does, which a device survives, and says so.
[[noreturn]] void leaveAtOnce(const Console& console);

}  // namespace appsync
