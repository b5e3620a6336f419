#include "host/command/change/ApplicationAction.h"

#include <memory>
#include <ostream>
#include <string>

#include <nlohmann/json.hpp>

#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/change/ChangeCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"

namespace appsync {

int actOn(const ApplicationArguments& arguments, const DeviceOpenOptions& options,
          const ActionTexts& texts, const Console& console,
          const std::function<Result<ActionOutcome>(Device& device)>& action) {
    const std::string& identifier = arguments.identifier;
    const Status checked = checkIdentifier(identifier, kGiveAsShown);
    if (!checked) return console.fail(checked.error());
    const Result<std::unique_ptr<Device>> device = openDevice(arguments.device, options);
    if (!device) return console.fail(device.error());
    const Result<ActionOutcome> outcome = action(**device);
    if (const auto broken = (*device)->databaseFailure()) return console.fail(unusable(*broken));
    if (!outcome) return console.fail(classified(outcome.error()));
    const bool hasChanged = *outcome == ActionOutcome::Done;
    if (arguments.asJson) {
        console.out << indented({{"identifier", identifier},
                                 {"state", texts.state},
                                 {"changed", hasChanged}})
                    << '\n';
    } else {
        console.out << identifier << ' ' << (hasChanged ? texts.done : texts.wasSo) << '\n';
    }
    return kExitDone;
}

}  // namespace appsync
