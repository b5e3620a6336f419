#include <memory>
#include <ostream>

#include "device/Device.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/look/LookCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/output/JsonRecords.h"
#include "host/session/Inventory.h"
#include "host/session/PlugIn.h"

namespace appsync {
namespace {

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

}  // namespace

int runInventory(const std::string& device, bool asJson, const Console& console) {
    return lookAt(device, console, [&](Device& opened) -> Status {
        const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(opened, console);
        if (!plugIn) return plugIn.error();
        const Inventory inventory = inventoryOf((*plugIn)->client());
        if (const auto error = opened.databaseFailure()) return unusable(*error);
        console.out << (asJson ? jsonText(inventory) + "\n" : inventoryText(inventory));
        return {};
    });
}

}  // namespace appsync
