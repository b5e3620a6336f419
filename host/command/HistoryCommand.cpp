#include <ostream>

#include "device/Device.h"
#include "host/command/Commands.h"
#include "host/command/IdentifierArgument.h"
#include "host/command/OpenDevice.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Table.h"
#include "host/console/Text.h"
#include "host/output/JsonRecords.h"

namespace appsync {
namespace {

std::string whatText(const HistoryRecord& record) {
    if (record.kind == HistoryRecord::Kind::Scenario) return record.scenario;
    return "step " + std::to_string(record.step) + (record.phase == 1 ? " begins" : " ends");
}

std::string historyTable(const std::vector<HistoryRecord>& records, const Console& console) {
    Table table({"TIME", "WHAT", "RESULT", "IDENTIFIER", "DESCRIPTION"});
    for (const HistoryRecord& record : records) {
        table.add({formatLocalTime(record.time), whatText(record), record.success ? "ok" : "failed",
                   record.identifier, record.description});
    }
    if (console.isTerminal) table.fitInto(console.width);
    return records.empty() ? "No history.\n" : table.text();
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
        if (arguments.application) {
            std::erase_if(*records, [&](const HistoryRecord& each) {
                return each.identifier != *arguments.application;
            });
        }
        console.out << (arguments.asJson ? jsonText(*records) + "\n" : historyTable(*records, console));
        return {};
    });
}

}  // namespace appsync
