#pragma once

#include <set>
#include <string>
#include <unordered_set>
#include <vector>

#include "client/ItemMap.h"
#include "client/Log.h"

namespace appsync {

class AppsClient;
struct Platform;
struct TransferItem;

/// What one call of `outstandingAssetTransfers` may ask for: the applications that the todo list
/// asks to install and the placeholders on the device, but for what is under way already.
class WantedTransfers {
  public:
    /// Gathers them. Borrows everything.
    WantedTransfers(const AppsClient& client, const Platform& platform, bool isCoordinated,
                    const std::set<std::string>& ignoredRestores);

    /// Hands the item maps over, in the order in which they are to be asked for.
    [[nodiscard]] std::vector<PropertyList> takeItems();

    /// Whether the application must not be asked for; logs why.
    [[nodiscard]] bool isSkipped(const TransferItem& item) const;
    /// Whether it had a placeholder when they were gathered.
    [[nodiscard]] bool hasPlaceholder(const std::string& identifier) const {
        return placeholders_.contains(identifier);
    }

  private:
    void gatherPlaceholders(const AppsClient& client);
    void gatherTodoEntries(const PropertyList& todoList);
    void gatherTodoEntry(const PropertyList& entry);
    void leaveOutInProgress();
    [[nodiscard]] bool isSkippedRestore(const TransferItem& item) const;
    [[nodiscard]] bool isSkippedSystemApp(const TransferItem& item) const;
    [[nodiscard]] bool isSkippedDemotedApp(const TransferItem& item) const;

    const Platform& platform_;
    const Log log_;
    const bool isCoordinated_;
    const std::set<std::string>& ignoredRestores_;
    const bool installationAllowed_;
    // Those that the todo list asks to install.
    std::unordered_set<std::string> requestedIdentifiers_;
    ItemMap items_;
    ItemMap placeholders_;
    std::set<std::string> systemAppPlaceholders_;
};

}  // namespace appsync
