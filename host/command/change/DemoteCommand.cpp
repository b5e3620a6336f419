#include "device/Device.h"
#include "host/command/change/ApplicationAction.h"
#include "host/command/change/ChangeCommands.h"
#include "platform/AppRegistry.h"

namespace appsync {
namespace {

bool isOffloadedOnly(const ApplicationStatus& status) {
    if (status.installed || !status.placeholder) return false;
    const std::uint64_t type = status.placeholder->installType;
    return type == kInstallTypeDowngrade || type == kInstallTypeIntentionalDowngrade;
}

Result<ActionOutcome> offload(Device& device, const std::string& identifier, DemotedBy by) {
    const Result<ApplicationStatus> before = device.status(identifier);
    if (!before) return before.error();
    if (isOffloadedOnly(*before)) return ActionOutcome::WasSo;
    const Status status = device.demote(identifier, by);
    if (!status) return status.error();
    return ActionOutcome::Done;
}

}  // namespace

int runDemote(const ApplicationArguments& arguments, bool bySystem, const Console& console) {
    const DemotedBy by = bySystem ? DemotedBy::System : DemotedBy::Person;
    const DeviceOpenOptions options{.access = DeviceAccess::Session, .makesRoom = true};
    const ActionTexts texts{"is offloaded", "is offloaded already", "offloaded"};
    return actOn(arguments, options, texts, console,
                 [&](Device& opened) { return offload(opened, arguments.identifier, by); });
}

}  // namespace appsync
