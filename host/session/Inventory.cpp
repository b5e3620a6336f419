#include "host/session/Inventory.h"

#include <string_view>

#include "platform/AppRegistry.h"
#include "platform/PropertyList.h"
#include "platform/SyncClient.h"

namespace appsync {
namespace {

std::uint64_t numberAt(const PropertyList& map, std::string_view key) {
    const PropertyList* value = map.find(key);
    return value != nullptr ? value->asUnsigned().value_or(0) : 0;
}

}  // namespace

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

}  // namespace appsync
