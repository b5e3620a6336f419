#include "transfer/WantedTransfers.h"

#include <utility>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/SafeIdentifier.h"
#include "client/TodoList.h"
#include "transfer/InProgressAssetQuery.h"
#include "transfer/TransferItem.h"

namespace appsync {

WantedTransfers::WantedTransfers(const AppsClient& client, const Platform& platform,
                                 bool isCoordinated, const std::set<std::string>& ignoredRestores)
    : platform_(platform),
      log_(platform),
      isCoordinated_(isCoordinated),
      ignoredRestores_(ignoredRestores),
      installationAllowed_(client._appInstallationAllowed()) {
    const std::optional<PropertyList> todoList =
        AppsClient::_loadPlist(platform, kTodoListPath, nullptr);
    log_.applications(Level::Default,
                      "%s|outstandingAssetTransfers starting with todoList %{public}@", todoList);
    const std::size_t todoCount = todoList ? todoList->size() : 0;
    items_ = ItemMap(todoCount);
    requestedIdentifiers_.reserve(todoCount);
    gatherPlaceholders(client);
    if (todoList) gatherTodoEntries(*todoList);
    leaveOutInProgress();
}

std::vector<PropertyList> WantedTransfers::takeItems() {
    return AppsClient::_orderTheItems(platform_, items_);
}

void WantedTransfers::gatherPlaceholders(const AppsClient& client) {
    systemAppPlaceholders_ = client._getSystemAppPlaceholders();
    client._enumeratePlaceholdersWithBlock([this](const AppProxy& placeholder, bool&) {
        PropertyList item = itemMapFromPlaceholder(placeholder);
        items_.add(placeholder.applicationIdentifier, item);
        placeholders_.add(placeholder.applicationIdentifier, std::move(item));
    });
    log_.applications(Level::Default,
                      "%s|outstandingAssetTransfers preExistingPlaceHolders %{public}@, idsWeWant "
                      "%{public}@",
                      placeholders_.description(), items_.description());
}

void WantedTransfers::gatherTodoEntries(const PropertyList& todoList) {
    for (const PropertyList& entry : todoList.elements()) {
        if (hasOperation(entry, kTodoInstall)) gatherTodoEntry(entry);
    }
}

void WantedTransfers::gatherTodoEntry(const PropertyList& entry) {
    const PropertyList* value = entry.find(kTodoIdentifierKey);
    if (!isSafe(value)) {
        log_(Level::Default, "%s|Ignoring invalid path: %{public}@", value);
        return;
    }
    const std::string& identifier = *value->asString();
    requestedIdentifiers_.insert(identifier);
    if (!items_.add(identifier, itemMapFromTodoEntry(identifier, entry))) {
        log_(Level::Default, "%s|%{public}@ already has a placeholder - skipping", identifier);
    }
}

void WantedTransfers::leaveOutInProgress() {
    InProgressAssetQuery::Identifiers inProgress;
    InProgressAssetQuery::Identifiers restoring;
    InProgressAssetQuery::currentInProgressAssetIDs(platform_, inProgress, restoring);
    if (inProgress) {
        log_(Level::Default, "%s|Assets already in progress (not returning these): %{public}@",
             PropertyList::strings(*inProgress));
        for (const std::string& identifier : *inProgress) items_.take(identifier);
    } else {
        log_(Level::Error, "%s|Failed to get list of assets already in progress!");
    }
    if (restoring) {
        log_(Level::Default, "%s|Assets currently restoring: %{public}@",
             PropertyList::strings(*restoring));
    } else {
        log_(Level::Error, "%s|Failed to get list of assets currently restoring!");
    }
}

bool WantedTransfers::isSkipped(const TransferItem& item) const {
    if (!installationAllowed_ && !item.isRestore) {
        log_(Level::Default,
             "%s|skipping %{public}@ - its not a restore and app installation is disabled",
             item.identifier);
        return true;
    }
    return isSkippedRestore(item) || isSkippedSystemApp(item) || isSkippedDemotedApp(item);
}

bool WantedTransfers::isSkippedRestore(const TransferItem& item) const {
    if (!item.isRestore) return false;
    if (ignoredRestores_.contains(item.identifier)) {
        log_(Level::Default,
             "%s|%{public}@ is currenlty marked as to be ignored for download - skipping",
             item.identifier);
        return true;
    }
    if (!isCoordinated_) return false;
    log_(Level::Default,
         "%s|%{public}@ is currenlty marked to be restored and will be handled by bazaard - "
         "skipping",
         item.identifier);
    return true;
}

bool WantedTransfers::isSkippedSystemApp(const TransferItem& item) const {
    if (item.isSystemApp && isCoordinated_) {
        log_(Level::Default,
             "%s|%{public}@ is auto demoted: %d, manual demoted: %d, system app:%d - skipping",
             item.identifier, item.isAutomaticallyDemoted, item.isIntentionallyDemoted,
             item.isSystemApp);
        return true;
    }
    if (!systemAppPlaceholders_.contains(item.identifier)) return false;
    log_(Level::Default, "%s|%{public}@ is system app placeholder - skipping", item.identifier);
    return true;
}

bool WantedTransfers::isSkippedDemotedApp(const TransferItem& item) const {
    const bool isDemoted = item.isAutomaticallyDemoted || item.isIntentionallyDemoted;
    if (!isDemoted || !isCoordinated_) return false;
    // The numbers stand in the reverse order of their labels on purpose.
    if (requestedIdentifiers_.contains(item.identifier)) {
        log_(Level::Default,
             "%s|%{public}@ is currenlty demoted (manual:%d, auto:%d) - but will be installed as "
             "it's requested by client",
             item.identifier, item.isAutomaticallyDemoted, item.isIntentionallyDemoted);
        return false;
    }
    log_(Level::Default, "%s|%{public}@ is currenlty demoted (manual:%d, auto:%d) - skipping",
         item.identifier, item.isAutomaticallyDemoted, item.isIntentionallyDemoted);
    return true;
}

}  // namespace appsync
