#include <ostream>

#include "device/Device.h"
#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/look/LookCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/output/JsonRecords.h"
#include "host/output/WhyAnswer.h"
#include "host/plan/RestoredParts.h"

namespace appsync {

int runWhy(const std::string& device, const std::string& identifier, bool asJson,
           const Console& console) {
    const Status checked = checkIdentifier(identifier, kGiveAsShown);
    if (!checked) return console.fail(checked.error());
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<ApplicationStatus> status = opened.status(identifier);
        if (!status) return status.error();
        const Result<DeviceSettings> settings = opened.settings();
        if (!settings) return unusable(settings.error());
        const WhyAnswer answer = explain(identifier, *status, *settings,
                                         versionThatWaitsForData(opened, identifier).has_value());
        const bool isUnknown = answer.state == "absent" && !answer.lastError && !answer.waitsFor &&
                               !status->uninstalled;
        if (isUnknown) {
            return failure("the device knows nothing of " + identifier,
                           "appsync apps shows what there is");
        }
        console.out << (asJson ? jsonText(answer) + "\n" : whyText(answer));
        return {};
    });
}

}  // namespace appsync
