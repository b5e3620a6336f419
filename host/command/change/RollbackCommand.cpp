#include <ostream>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/change/ChangeCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;

std::string toldVersion(const std::optional<std::string>& version) {
    return version ? printable(*version) : "-";
}

std::string rollbackLine(const std::string& identifier, const RollbackRecord& record) {
    const std::string former = toldVersion(record.oldVersion);
    return identifier + " is rolled back from " + former + " to " + toldVersion(record.newVersion) +
           "; its data stays as it is, and a sync of a library with " + former +
           " updates it again";
}

std::string rollbackJson(const std::string& identifier, const RollbackRecord& record) {
    return indented({{"identifier", identifier},
                     {"state", "rolled back"},
                     {"changed", true},
                     {"oldVersion", record.oldVersion ? Json(*record.oldVersion) : Json()},
                     {"newVersion", record.newVersion ? Json(*record.newVersion) : Json()}});
}

}  // namespace

int runRollback(const ApplicationArguments& arguments, const Console& console) {
    const std::string& identifier = arguments.identifier;
    const Status checked = checkIdentifier(identifier, kGiveAsShown);
    if (!checked) return console.fail(checked.error());
    const Result<std::unique_ptr<Device>> device =
        openDevice(arguments.device,
                   {.access = DeviceAccess::Session, .borrowsRoom = true, .sparesKept = true});
    if (!device) return console.fail(device.error());
    const Result<RollbackRecord> record = (*device)->rollBack(identifier);
    if (const auto broken = (*device)->databaseFailure()) return console.fail(unusable(*broken));
    if (!record) return console.fail(classified(record.error()));
    console.out << (arguments.asJson ? rollbackJson(identifier, *record)
                                     : rollbackLine(identifier, *record))
                << '\n';
    return kExitDone;
}

}  // namespace appsync
