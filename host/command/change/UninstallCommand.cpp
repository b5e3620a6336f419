#include "device/Device.h"
#include "host/command/change/ApplicationAction.h"
#include "host/command/change/ChangeCommands.h"

namespace appsync {

int runUninstall(const ApplicationArguments& arguments, const Console& console) {
    const ActionTexts texts{"is uninstalled", "", "absent"};  // what is not there is refused
    return actOn(arguments, {.makesRoom = true}, texts, console,
                 [&](Device& opened) -> Result<ActionOutcome> {
                     const Status status = opened.uninstall(arguments.identifier);
                     if (!status) return status.error();
                     return ActionOutcome::Done;
                 });
}

}  // namespace appsync
