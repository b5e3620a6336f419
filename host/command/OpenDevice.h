#pragma once

#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "device/Device.h"
#include "platform/Result.h"

namespace appsync {

struct ApplicationArguments;
struct Console;

/// Opens a device for a command; the error has the exit status "unusable".
[[nodiscard]] Result<std::unique_ptr<Device>> openDevice(const std::string& path,
                                                         DeviceAccess access);

/// The same with all that there is to say.
[[nodiscard]] Result<std::unique_ptr<Device>> openDevice(const std::string& path,
                                                         const DeviceOpenOptions& options);

/// The error of an operation on a device: when it tells that the device itself cannot be used, one
/// with that exit status; else as it is.
[[nodiscard]] ErrorRecord classified(const ErrorRecord& error);

/// What a command does with a device that is open.
using WorkOnDevice = std::function<Status(Device& device)>;

/// Opens a device for looking and hands it on. Gives the exit status.
[[nodiscard]] int lookAt(const std::string& path, const Console& console, const WorkOnDevice& look);

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
