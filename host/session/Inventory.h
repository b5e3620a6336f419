#pragma once

#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "platform/SyncAccountInfo.h"

namespace appsync {

class SyncClient;

/// What the plug-in reports of the device.
struct Inventory {
    std::vector<std::string> deleted;
    std::uint64_t count = 0;
    std::uint64_t physicalSize = 0;
    std::uint64_t purgeableSize = 0;
    std::set<std::string> accountIDs;
    std::set<SyncAccountInfo> accounts;
};

/// Asks the plug-in, as a host does in a session.
[[nodiscard]] Inventory inventoryOf(SyncClient& client);

}  // namespace appsync
