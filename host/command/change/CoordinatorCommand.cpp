#include <ostream>

#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/change/ChangeCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Table.h"
#include "host/console/Text.h"
#include "host/output/JsonRecords.h"

namespace appsync {
namespace {

Status checkArguments(const CoordinatorArguments& arguments) {
    const bool isList = arguments.action == "list";
    if (arguments.action == "create" && arguments.client == SyncClientID) {
        return wrongUsage(
            "client " + std::to_string(SyncClientID) + " is the sync daemon's plug-in",
            "let appsync sync create its coordinators, or play another client");
    }
    if (isList && !arguments.identifier.empty()) {
        return wrongUsage("coordinator list takes no identifier", "leave it out");
    }
    if (!isList && arguments.identifier.empty()) {
        return wrongUsage("coordinator " + arguments.action + " needs an identifier",
                          "name the application");
    }
    return isList ? Status() : checkIdentifier(arguments.identifier, kUseLegalCharacters);
}

std::string promisesText(const CoordinatorRecord& coordinator) {
    std::string text;
    for (const PromiseRecord& promise : coordinator.promises) {
        const auto percent = static_cast<unsigned>(promise.percent * 100);
        text += text.empty() ? "" : ", ";
        text += printable(promise.name) + " ";
        if (promise.cancelled) {
            text += "given up";
        } else {
            text += promise.complete ? "kept" : std::to_string(percent) + " %";
        }
    }
    return text.empty() ? "-" : text;
}

std::string coordinatorsTable(const std::vector<CoordinatorRecord>& coordinators,
                              const Console& console) {
    if (coordinators.empty()) return "No coordinators.\n";
    Table table({"IDENTIFIER", "KIND", "CLIENT", "PLACEHOLDER", "PROMISES", "STATE"});
    table.keepEndsOf(0);
    table.spare({3, 1, 4, 2});
    for (const CoordinatorRecord& each : coordinators) {
        table.add({each.identifier, each.kind, std::to_string(each.client),
                   each.placeholderStands ? "shown" : (each.hasPlaceholder ? "not shown" : "-"),
                   promisesText(each), coordinatorState(each)});
    }
    return table.textFor(console);
}

int listCoordinators(Device& device, bool asJson, const Console& console) {
    const Result<std::vector<CoordinatorRecord>> coordinators = device.coordinators();
    if (!coordinators) return console.fail(unusable(coordinators.error()));
    console.out << (asJson ? jsonText(*coordinators) + "\n"
                           : coordinatorsTable(*coordinators, console));
    return kExitDone;
}

Status act(Device& device, const CoordinatorArguments& arguments) {
    return arguments.action == "create"
               ? device.createCoordinator(arguments.identifier, arguments.client)
               : device.cancelCoordinator(arguments.identifier, arguments.client);
}

}  // namespace

int runCoordinator(const CoordinatorArguments& arguments, const Console& console) {
    const Status checked = checkArguments(arguments);
    if (!checked) return console.fail(checked.error());
    const bool isList = arguments.action == "list";
    const Result<std::unique_ptr<Device>> device =
        openDevice(arguments.device, {.borrowsRoom = !isList});
    if (!device) return console.fail(device.error());
    if (isList) return listCoordinators(**device, arguments.asJson, console);
    const Status done = act(**device, arguments);
    if (!done) return console.fail(classified(done.error()));
    if (arguments.asJson) return listCoordinators(**device, true, console);
    const bool isCreated = arguments.action == "create";
    console.out << "client " << arguments.client << (isCreated ? " has created" : " has cancelled")
                << " the coordinator of " << arguments.identifier << '\n';
    return kExitDone;
}

}  // namespace appsync
