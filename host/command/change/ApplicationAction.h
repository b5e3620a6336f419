#pragma once

#include <functional>
#include <string_view>

#include "device/Device.h"
#include "platform/Result.h"

namespace appsync {

struct ApplicationArguments;
struct Console;

/// Whether an action has changed anything.
enum class ActionOutcome { Done, WasSo };

/// How a command tells what it has done to an application.
struct ActionTexts {
    /// What follows the identifier: "is offloaded", "is offloaded already".
    std::string_view done;
    std::string_view wasSo;
    /// What the application is now, in JSON.
    std::string_view state;
};

/// Does something to one application of a device and says so in one line, or in JSON. Gives the
/// exit status.
[[nodiscard]] int actOn(const ApplicationArguments& arguments, const DeviceOpenOptions& options,
                        const ActionTexts& texts, const Console& console,
                        const std::function<Result<ActionOutcome>(Device& device)>& action);

}  // namespace appsync
