#include <memory>
#include <ostream>
#include <utility>

#include "device/Device.h"
#include "device/screen/HomeScreenPicture.h"
#include "host/command/Commands.h"
#include "host/command/IdentifierArgument.h"
#include "host/command/OpenDevice.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Table.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"
#include "host/output/JsonRecords.h"
#include "host/output/WhyAnswer.h"
#include "host/session/PlugIn.h"
#include "platform/AppRegistry.h"
#include "platform/SyncClient.h"

namespace appsync {
namespace {

std::string stateText(const ApplicationRecord& record) {
    if (!record.isPlaceholder) return "installed";
    if (!record.progress) return "placeholder";
    const auto percent = static_cast<unsigned>(record.progress->fraction() * 100);
    return "placeholder, " + std::to_string(percent) + " %";
}

std::string applicationsTable(const std::vector<ApplicationRecord>& records, bool isForTerminal) {
    Table table({"IDENTIFIER", "VERSION", "NAME", "STATE", "TYPE", "SIZE"});
    for (const ApplicationRecord& record : records) {
        table.add({record.identifier, record.version.value_or("-"), record.name.value_or("-"),
                   stateText(record), record.type, formatBytes(record.bytes)});
    }
    if (isForTerminal) table.limit({40, 16, 24});  // a program gets all of it
    return records.empty() ? "No applications.\n" : table.text();
}

std::string whatText(const HistoryRecord& record) {
    if (record.kind == HistoryRecord::Kind::Scenario) return record.scenario;
    return "step " + std::to_string(record.step) + (record.phase == 1 ? " begins" : " ends");
}

std::string historyTable(const std::vector<HistoryRecord>& records) {
    Table table({"TIME", "WHAT", "RESULT", "IDENTIFIER", "DESCRIPTION"});
    for (const HistoryRecord& record : records) {
        table.add({formatTime(record.time), whatText(record), record.success ? "ok" : "failed",
                   record.identifier, record.description});
    }
    return records.empty() ? "No history.\n" : table.text();
}

std::uint64_t numberAt(const PropertyList& map, std::string_view key) {
    const PropertyList* value = map.find(key);
    return value != nullptr ? value->asUnsigned().value_or(0) : 0;
}

Inventory inventoryOf(SyncClient& client) {
    Inventory inventory;
    const PropertyList assets = client.installedAssets();
    if (const PropertyList* deleted = assets.find("_Deleted")) {
        for (const PropertyList& each : deleted->elements()) {
            const std::string* identifier = each.findString(BundleIdentifierKey);
            if (identifier != nullptr) inventory.deleted.push_back(*identifier);
        }
    }
    const PropertyList metrics = client.installedAssetMetrics();
    inventory.count = numberAt(metrics, "_Count");
    inventory.physicalSize = numberAt(metrics, "_PhysicalSize");
    inventory.purgeableSize = numberAt(metrics, "_PurgeableSize");
    inventory.accountIDs = client.korvuIDsForAssets();
    inventory.accounts = client.accountsForAssets();
    return inventory;
}

std::string inventoryText(const Inventory& inventory) {
    std::string text = counted(inventory.count, "user application") + ", " +
                       formatBytes(inventory.physicalSize) + " (" +
                       formatBytes(inventory.purgeableSize) + " purgeable)\n";
    for (const std::string& identifier : inventory.deleted) {
        text += "deleted since the last sync: " + printable(identifier) + "\n";
    }
    for (const std::string& account : inventory.accountIDs) {
        text += "account: " + printable(account) + "\n";
    }
    return text;
}

// Opens a device for looking and hands it on.
template <typename Look>
int lookAt(const std::string& path, const Console& console, Look look) {
    const Result<std::unique_ptr<Device>> device = openDevice(path, DeviceAccess::Look);
    if (!device) return console.fail(device.error());
    const Status status = look(**device);
    return status ? kExitDone : console.fail(classified(status.error()));
}

Status writeScreen(Device& device, const std::string& picture) {
    const Result<std::vector<HomeScreenItem>> items = device.homeScreen();
    if (!items) return items.error();
    const Result<Bytes> png = drawHomeScreen(*items, "appsync");
    if (!png) return png.error();
    return writeHostFile(picture, *png);
}

}  // namespace

int runApps(const std::string& device, bool asJson, const Console& console) {
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<std::vector<ApplicationRecord>> records = opened.applications();
        if (!records) return unusable(records.error());
        console.out << (asJson ? jsonText(*records) + "\n"
                               : applicationsTable(*records, console.isTerminal));
        return {};
    });
}

int runWhy(const std::string& device, const std::string& identifier, bool asJson,
           const Console& console) {
    const Status checked = checkIdentifier(identifier, kGiveAsShown);
    if (!checked) return console.fail(checked.error());
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<ApplicationStatus> status = opened.status(identifier);
        if (!status) return status.error();
        const Result<DeviceSettings> settings = opened.settings();
        if (!settings) return unusable(settings.error());
        const WhyAnswer answer = explain(identifier, *status, *settings);
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

int runInventory(const std::string& device, bool asJson, const Console& console) {
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(opened);
        if (!plugIn) return plugIn.error();
        const Inventory inventory = inventoryOf((*plugIn)->client());
        if (const auto error = opened.databaseFailure()) return unusable(*error);
        console.out << (asJson ? jsonText(inventory) + "\n" : inventoryText(inventory));
        return {};
    });
}

int runHistory(const std::string& device, bool asJson, const Console& console) {
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<std::vector<HistoryRecord>> records = opened.history();
        if (!records) return unusable(records.error());
        console.out << (asJson ? jsonText(*records) + "\n" : historyTable(*records));
        return {};
    });
}

int runScreen(const std::string& device, const std::string& picture, const Console& console) {
    return lookAt(device, console,
                  [&](Device& opened) -> Status { return writeScreen(opened, picture); });
}

}  // namespace appsync
