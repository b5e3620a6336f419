#include <ostream>

#include "device/Device.h"
#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/look/LookCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Table.h"
#include "host/console/Text.h"
#include "host/output/FailureText.h"
#include "host/output/JsonRecords.h"

namespace appsync {
namespace {

std::string whatText(const HistoryRecord& record) {
    if (record.kind == HistoryRecord::Kind::Scenario) return record.scenario;
    return "step " + std::to_string(record.step) + (record.phase == 1 ? " begins" : " ends");
}

std::string historyTable(const std::vector<HistoryRecord>& records, const Console& console) {
    Table table({"TIME", "WHAT", "RESULT", "IDENTIFIER", "DESCRIPTION"});
    table.keepEndsOf(3);
    table.spare({4, 0, 1});
    for (const HistoryRecord& record : records) {
        table.add({formatLocalTime(record.time), whatText(record), record.success ? "ok" : "failed",
                   record.identifier, record.description});
    }
    return records.empty() ? "No history.\n" : table.textFor(console);
}

// Of a failed install the log has every step that went well, and not always one that did not.
std::string failureTable(const std::vector<FailedInstall>& failed, const Console& console) {
    if (failed.empty()) return {};
    Table table({"TIME", "LAST INSTALL FAILED", "ERROR"});
    table.keepEndsOf(1);
    table.spare({0});
    for (const FailedInstall& each : failed) {
        table.add({formatLocalTime(each.failure.when), each.identifier,
                   failureText(each.identifier, each.failure.error)});
    }
    return "\n" + table.textFor(console);
}

}  // namespace

int runHistory(const HistoryArguments& arguments, const Console& console) {
    if (arguments.application) {
        const Status checked = checkIdentifier(*arguments.application, kGiveAsShown, "--app");
        if (!checked) return console.fail(checked.error());
    }
    return lookAt(arguments.device, console, [&](Device& opened) -> Status {
        Result<std::vector<HistoryRecord>> records = opened.history();
        if (!records) return unusable(records.error());
        const auto isOfAnother = [&](const auto& each) {
            return arguments.application && each.identifier != *arguments.application;
        };
        std::erase_if(*records, isOfAnother);
        if (arguments.asJson) {
            console.out << jsonText(*records) << '\n';
            return {};
        }
        Result<std::vector<FailedInstall>> failed = opened.failedInstalls();
        if (!failed) return unusable(failed.error());
        std::erase_if(*failed, isOfAnother);
        console.out << historyTable(*records, console) << failureTable(*failed, console);
        return {};
    });
}

}  // namespace appsync
