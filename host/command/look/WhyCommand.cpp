#include <ostream>

#include "device/Device.h"
#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/look/LookCommands.h"
#include "host/console/Console.h"
#include "host/output/JsonRecords.h"
#include "host/output/WhyAnswer.h"

namespace appsync {

int runWhy(const std::string& device, const std::string& identifier, bool asJson,
           const Console& console) {
    const Status checked = checkIdentifier(identifier, kGiveAsShown);
    if (!checked) return console.fail(checked.error());
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<WhyAnswer> answer = whyOf(opened, identifier);
        if (!answer) return answer.error();
        console.out << (asJson ? jsonText(*answer) + "\n" : whyText(*answer));
        return {};
    });
}

}  // namespace appsync
