#include <algorithm>
#include <ostream>
#include <string>
#include <utility>
#include <vector>

#include "device/Device.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/look/LookCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Table.h"
#include "host/console/Text.h"
#include "host/output/JsonRecords.h"

namespace appsync {
namespace {

std::string stateText(const ApplicationRecord& record) {
    if (!record.isPlaceholder) return "installed";
    std::string text(placeholderKind(record));
    if (!record.progress) return text;
    const auto percent = static_cast<unsigned>(record.progress->fraction() * 100);
    return text + ", " + std::to_string(percent) + " %";
}

std::string applicationsTable(const std::vector<ApplicationRecord>& records,
                              const Console& console) {
    std::vector<std::string> titles{"IDENTIFIER", "VERSION", "NAME", "STATE", "TYPE", "SIZE"};
    const bool anyKept =
        std::any_of(records.begin(), records.end(),
                    [](const ApplicationRecord& record) { return record.kept.has_value(); });
    if (anyKept) titles.emplace_back("KEPT");
    Table table(std::move(titles));
    table.keepEndsOf(0);
    table.spare({4, 6, 5, 2, 1});
    for (const ApplicationRecord& record : records) {
        std::vector<std::string> cells{record.identifier,
                                       record.version.value_or("-"),
                                       record.name.value_or("-"),
                                       stateText(record),
                                       record.type,
                                       formatBytes(record.bytes)};
        if (anyKept) cells.push_back(record.kept ? record.kept->version.value_or("-") : "");
        table.add(std::move(cells));
    }
    return records.empty() ? "No applications.\n" : table.textFor(console);
}

}  // namespace

int runApps(const std::string& device, bool asJson, const Console& console) {
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<std::vector<ApplicationRecord>> records = opened.applications();
        if (!records) return unusable(records.error());
        console.out << (asJson ? jsonText(*records) + "\n" : applicationsTable(*records, console));
        return {};
    });
}

}  // namespace appsync
