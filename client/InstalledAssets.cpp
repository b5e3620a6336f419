#include <cstdint>
#include <mutex>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/StoreMetadataFile.h"
#include "client/TodoList.h"
#include "platform/InstallerService.h"

namespace appsync {

namespace {

constexpr std::string_view kDeletedKey = "_Deleted";
constexpr std::string_view kCountKey = "_Count";
constexpr std::string_view kPhysicalSizeKey = "_PhysicalSize";
constexpr std::string_view kPurgeableSizeKey = "_PurgeableSize";

std::vector<std::string> keysOf(const PropertyList& map) {
    std::vector<std::string> keys;
    keys.reserve(map.size());
    for (const PropertyList::Entry& entry : map.entries()) keys.push_back(entry.key);
    return keys;
}

/// Those of the list that are no longer on the device.
std::set<std::string> goneSince(const PropertyList& lastSynced, AppRegistry& registry) {
    std::set<std::string> gone;
    for (const PropertyList& element : lastSynced.elements()) {
        const std::string* identifier = element.asString();
        if (identifier != nullptr && !registry.isApplicationInstalled(*identifier)) {
            gone.insert(*identifier);
        }
    }
    return gone;
}

/// Whether an application that is not installed counts as deleted: not while the host still has an
/// install of it pending.
bool isDeleted(const std::string& identifier, const TodoIndex* todo, const Log& log) {
    const PropertyList* entry = todo != nullptr ? todo->find(identifier) : nullptr;
    const bool found = entry != nullptr;
    const bool failed = found && hasOperation(*entry, kTodoFailed);
    const bool installed = found && !failed && hasOperation(*entry, kTodoInstalled);
    if (found && !installed && !failed) {
        log(Level::Default,
            "%s|%{public}@ not installed, but is in our todo list. Not marking deleted",
            identifier);
        return false;
    }
    log(Level::Default,
        "%s|%{public}@ not installed, and no todo (found=%d pi=%d failed=%d) Marking as deleted",
        identifier, found, installed, failed);
    return true;
}

PropertyList deletedAmong(const std::set<std::string>& candidates,
                          const std::optional<PropertyList>& todoList, const Log& log) {
    std::optional<TodoIndex> todo;
    if (todoList) todo.emplace(*todoList);
    PropertyList deleted = PropertyList::array();
    for (const std::string& identifier : candidates) {
        if (!isDeleted(identifier, todo ? &*todo : nullptr, log)) continue;
        deleted.append(PropertyList::map({{BundleIdentifierKey, identifier}}));
    }
    return deleted;
}

void addIfPresent(std::set<std::string>& identifiers,
                  const std::optional<std::string>& identifier) {
    if (identifier) identifiers.insert(*identifier);
}

void addKorvuIDs(const Platform& platform, const AppProxy& proxy, std::set<std::string>& ids) {
    const Log log(platform);
    const KorvuIDs own = readKorvuIDs(platform, proxy);
    if (own.top && own.account && *own.top != *own.account) {
        log(Level::Default, "%s|mismatched KorvuID keys for %{public}@: %{public}@ vs %{public}@",
            proxy.applicationIdentifier, own.top, own.account);
    }
    if (!own.top && !own.account) {
        log(Level::Default, "%s|unknown KorvuID for %{public}@ (plist at %{public}@)",
            proxy.applicationIdentifier, storeMetadataPath(proxy));
    }
    addIfPresent(ids, own.top);
    addIfPresent(ids, own.account);
}

void addAccount(const Platform& platform, const AppProxy& proxy, std::set<std::string>& seen,
                std::set<SyncAccountInfo>& accounts) {
    const auto account = readAccount(platform, proxy, [&](const std::string& accountID) {
        return seen.insert(accountID).second;
    });
    if (account) accounts.insert(*account);
}

PropertyList descriptionOf(const SyncAccountInfo& account) {
    PropertyList map = PropertyList::map({{"accountID", account.accountID}});
    if (account.personID) {
        std::visit([&map](auto number) { map.set("personID", number); }, *account.personID);
    }
    if (account.alternatePersonID) map.set("alternatePersonID", *account.alternatePersonID);
    return map;
}

PropertyList descriptionOf(const std::set<SyncAccountInfo>& accounts) {
    PropertyList list = PropertyList::array(accounts.size());
    for (const SyncAccountInfo& account : accounts) list.append(descriptionOf(account));
    return list;
}

std::optional<std::vector<std::string>> lookUpUninstalled(const Platform& platform) {
    const std::optional<PropertyList> uninstalled = platform.installer.lookupUninstalled();
    if (uninstalled) return keysOf(*uninstalled);
    const Log log(platform);
    log(Level::Error, "%s|PakmountLookupUninstalled returned NULL");
    return std::nullopt;
}

void uninstallEveryPlaceholder(const AppsClient& client, AppRegistry& registry, const Log& log) {
    client._enumeratePlaceholdersWithBlock([&](const AppProxy& proxy, bool&) {
        const std::string& identifier = proxy.applicationIdentifier;
        const Status uninstalled = registry.uninstallApplication(identifier, {});
        log(Level::Default, "%s|Uninstall %{public}@ = %c", identifier, yesOrNo(uninstalled.ok()));
    });
}

}  // namespace

PropertyList AppsClient::installedAssets() {
    log_(Level::Default, "%s|getting installed assets");
    const std::optional<PropertyList> todoList = _loadPlist(platform_, kTodoListPath, nullptr);
    const std::optional<PropertyList> lastSynced =
        _loadPlist(platform_, kLastSyncAppStatePath, nullptr);

    std::set<std::string> candidates;
    std::optional<PropertyList> uninstalled;
    if (const auto keys = lookUpUninstalled(platform_)) {
        _uninstalledApps = keys;
        candidates.insert(keys->begin(), keys->end());
        uninstalled = PropertyList::strings(*keys);
    }
    if (lastSynced) candidates.merge(goneSince(*lastSynced, platform_.registry));

    PropertyList result = PropertyList::map();
    result.set(kDeletedKey, deletedAmong(candidates, todoList, log_));
    log_(Level::Default,
         "%s|finished getting installed assets toDoList:%{public}@, uninstalled apps %{public}@, "
         "last synced apps%{public}@",
         todoList, uninstalled, lastSynced);
    return result;
}

void AppsClient::clearSyncData() {
    log_(Level::Default, "%s|blasting work area");
    {
        const std::lock_guard todoGuard(*todoListLock_);
        const std::lock_guard restoreGuard(*restoreStateLock_);
        platform_.files.removeItem(std::string(kWorkArea)).ignore();
    }
    log_(Level::Default, "%s|Uninstalling all placeholder apps");
    uninstallEveryPlaceholder(*this, platform_.registry, log_);

    const std::optional<PropertyList> uninstalled = platform_.installer.lookupUninstalled();
    if (!uninstalled) {
        log_(Level::Error, "%s|Failed to fetch uninstalled apps list to clear it");
    } else if (!platform_.installer.clearUninstalled(keysOf(*uninstalled))) {
        log_(Level::Error, "%s|Failed to clear uninstalled apps list");
    }
}

PropertyList AppsClient::installedAssetMetrics() {
    std::uint64_t count = 0;
    std::uint64_t physical = 0;
    const std::uint64_t purgeable = 0;
    platform_.registry.enumerateBundles(AppRegistry::kUserBundles,
                                        [&](const AppProxy& proxy, bool&) {
                                            if (proxy.applicationType != kApplicationTypeUser)
                                                return;
                                            physical += proxy.staticDiskUsage;
                                            ++count;
                                        });
    log_(Level::Default, "%s|found %ld apps using %lld bytes (%lld purgeable)",
         static_cast<std::int64_t>(count), static_cast<std::int64_t>(physical),
         static_cast<std::int64_t>(purgeable));
    return PropertyList::map(
        {{kCountKey, count}, {kPhysicalSizeKey, physical}, {kPurgeableSizeKey, purgeable}});
}

std::set<std::string> AppsClient::korvuIDsForAssets() {
    log_(Level::Default, "%s|getting id's for assets");
    std::set<std::string> ids;
    platform_.registry.enumerateBundles(
        AppRegistry::kUserBundles,
        [&](const AppProxy& proxy, bool&) { addKorvuIDs(platform_, proxy, ids); });
    log_(Level::Default, "%s|Returning korvu ID set: %{public}@", listOf(ids));
    return ids;
}

std::set<SyncAccountInfo> AppsClient::accountsForAssets() {
    log_(Level::Default, "%s|getting accounts for assets");
    std::set<std::string> seen;
    std::set<SyncAccountInfo> accounts;
    platform_.registry.enumerateBundles(
        AppRegistry::kUserBundles,
        [&](const AppProxy& proxy, bool&) { addAccount(platform_, proxy, seen, accounts); });
    log_(Level::Default, "%s|Returning accountInfo: %{public}@", descriptionOf(accounts));
    return accounts;
}

}  // namespace appsync
