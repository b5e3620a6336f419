#include "device/Device.h"
#include "host/command/change/ApplicationAction.h"
#include "host/command/change/ChangeCommands.h"

namespace appsync {
namespace {

// Runs or ends it; what is refused is refused also where it is so already.
Result<ActionOutcome> setRunning(Device& device, const std::string& identifier, bool runs) {
    const Result<ApplicationStatus> before = device.status(identifier);
    if (!before) return before.error();
    const Status status = runs ? device.run(identifier) : device.quit(identifier);
    if (!status) return status.error();
    return before->isRunning == runs ? ActionOutcome::WasSo : ActionOutcome::Done;
}

}  // namespace

int runRun(const ApplicationArguments& arguments, const Console& console) {
    const ActionTexts texts{"runs", "runs already", "running"};
    return actOn(arguments, {.borrowsRoom = true}, texts, console,
                 [&](Device& opened) { return setRunning(opened, arguments.identifier, true); });
}

int runQuit(const ApplicationArguments& arguments, const Console& console) {
    const ActionTexts texts{"does not run any more", "did not run", "not running"};
    return actOn(arguments, {.borrowsRoom = true}, texts, console,
                 [&](Device& opened) { return setRunning(opened, arguments.identifier, false); });
}

}  // namespace appsync
