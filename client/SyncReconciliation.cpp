#include <cstdint>
#include <mutex>
#include <system_error>
#include <utility>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/PropertyListFile.h"
#include "client/TodoList.h"
#include "client/TodoListFile.h"
#include "platform/HomeScreenService.h"
#include "platform/InstallTransactionLog.h"
#include "platform/InstallerService.h"
#include "platform/Notifications.h"

namespace appsync {

namespace {

constexpr std::string_view kSyncNotification = "com.korvu.deskora.trd.wsyncnotify";
constexpr std::uint64_t kSyncStarting = 1;
constexpr std::uint64_t kSyncDone = 0;

constexpr std::string_view kSyncScenario = "Vessik Sync";
constexpr std::string_view kUninstallFailed = "Uninstall failed";
constexpr std::string_view kUninstallSucceeded = "Uninstall succeeded";

constexpr std::uint64_t kIconStateVariant = 1;

void sendIconLayout(const Platform& platform) {
    const Result<Bytes> layout =
        platform.files.readFile(formatPath(kIconLayoutFormat, {kTodoDirectory}));
    if (!layout || layout->empty()) return;
    const Log log(platform);
    log(Level::Default, "%s|Sending iconlayout to DK");
    const auto connection = platform.homeScreen.blockableConnection();
    if (connection != nullptr) connection->setIconState(*layout);
}

void writeDebugCopy(const Platform& platform, const PropertyList& todoList) {
    writePropertyListFile(platform, std::string(kTodoListDebugPath), todoList,
                          PropertyListFormat::Binary)
        .ignore();
}

std::optional<Bytes> flattenedIconState(const Platform& platform) {
    const auto connection = platform.homeScreen.blockableConnection();
    if (connection == nullptr) return std::nullopt;
    return connection->flattenedIconState(kIconStateVariant);
}

/// The home screen's icon order, which is also saved; the null marker when there is none.
PropertyList saveIconOrder(const Platform& platform) {
    const Log log(platform);
    const std::optional<Bytes> state = flattenedIconState(platform);
    if (!state) {
        log(Level::Default, "%s|got no icon sort order from DK");
        return {};
    }
    log(Level::Default, "%s|saved icon sort order");
    platform.files.writeFileAtomically(std::string(kIconOrderPath), *state).ignore();
    Result<PropertyList> order = platform.propertyLists.parse(*state);
    return order ? *std::move(order) : PropertyList();
}

enum class Takeover { Failed, NothingToDo, Done };

/// Puts the host's todo list, and what came with it, in the place of the earlier one.
Takeover takeOverStagingArea(const Platform& platform, Lock& todoListLock, ErrorOut error) {
    const Log log(platform);
    const std::string todoDirectory(kTodoDirectory);
    const std::string stagingArea(kStagingArea);
    // An install that an earlier session left running must not write its list over the new one.
    const std::lock_guard guard(todoListLock);

    platform.files.removeItem(todoDirectory).ignore();
    const Status created = platform.files.createDirectory(std::string(kWorkArea), true, nullptr);
    if (!created) {
        report(created, error);
        log(Level::Default, "%s|can't create work area");
        return Takeover::Failed;
    }
    if (!platform.files.itemExists(stagingArea)) {
        log(Level::Default, "%s|Nothing to do");
        return Takeover::NothingToDo;
    }
    const Status moved = platform.files.moveItem(stagingArea, todoDirectory);
    if (!moved) {
        report(moved, error);
        log(Level::Default, "%s|Can't move staging area");
        return Takeover::Failed;
    }
    return Takeover::Done;
}

void deleteApplication(AppsClient& client, const Platform& platform, bool isCoordinated,
                       const std::string& identifier) {
    if (isCoordinated) {
        client.uninstallAppUsingCoordination(identifier);
        return;
    }
    const Status uninstalled = platform.registry.uninstallApplication(identifier, {});
    if (!uninstalled) {
        const Log log(platform);
        log(Level::Error, "%s|Uninstall of %{public}@ failed.", identifier);
    }
    platform.transactions.logScenario(kSyncScenario, 0, uninstalled.ok(), identifier,
                                      uninstalled ? kUninstallSucceeded : kUninstallFailed);
}

void performDeletions(AppsClient& client, const Platform& platform, bool isCoordinated,
                      const PropertyList& todoList) {
    const Log log(platform);
    const std::vector<std::string> identifiers = identifiersToRemove(todoList);
    for (const std::string& identifier : identifiers) {
        log(Level::Default, "%s|%{public}@ targeted for termination", identifier);
    }
    if (identifiers.empty()) return;
    log(Level::Default, "%s|performing %llu deletions", identifiers.size());
    for (const std::string& identifier : identifiers)
        deleteApplication(client, platform, isCoordinated, identifier);
}

/// The system's own text for an error of the file system, without what was attempted and where.
std::string systemTextOf(const ErrorRecord& error) {
    return std::generic_category().message(static_cast<int>(error.code));
}

/// Takes them off the installer's list, and forgets them.
void clearUninstalledApps(const Platform& platform,
                          std::optional<std::vector<std::string>>& uninstalled) {
    if (!uninstalled) return;
    const Log log(platform);
    log(Level::Default, "%s|clearing uninstalled apps: %{public}@",
        PropertyList::strings(*uninstalled));
    if (platform.installer.clearUninstalled(*uninstalled)) {
        uninstalled.reset();
    } else {
        log(Level::Error, "%s|Failed to clear uninstalled apps from Pakmount.");
    }
}

}  // namespace

bool AppsClient::reconcileSync(const PropertyList& /*request*/, const std::string& newAnchor,
                               const SyncProgressCallback& /*progressCallback*/, ErrorOut error) {
    log_(Level::Default, "%s|starting to reconcile sync with new anchor %{public}@", newAnchor);
    const bool result = reconcile(error);
    log_(Level::Default, "%s|finished reconcile sync");
    return result;
}

bool AppsClient::reconcile(ErrorOut error) {
    const Takeover takeover = takeOverStagingArea(platform_, *todoListLock_, error);
    if (takeover != Takeover::Done) return takeover == Takeover::NothingToDo;

    const bool removalAllowed = _appRemovalAllowed();
    const std::optional<PropertyList> todoList = _loadPlist(platform_, kTodoListPath, error);
    if (!todoList) {
        log_(Level::Default, "%s|Nothing to do from Vessik");
    } else if (!removalAllowed) {
        log_(Level::Default, "%s|Not processing deletes because app removal is restricted");
    } else {
        performDeletions(*this, platform_, _useInstallCoordinator, *todoList);
    }
    _notifyDeskora(platform_, true);
    sendIconLayout(platform_);
    if (todoList) writeDebugCopy(platform_, *todoList);
    return true;
}

void AppsClient::syncEndedWithSuccess(bool success) {
    log_(Level::Default, "%s|sync ended with success: %c", yesOrNo(success));
    if (!success) return;
    const Status touched = platform_.files.setTimesToNow(std::string(kWorkArea));
    if (!touched) {
        log_(Level::Error, "%s|Failed to update utimes of \"%s\": %s", kWorkArea,
             systemTextOf(touched.error()));
    }
    clearUninstalledApps(platform_, _uninstalledApps);
    platform_.files.removeItem(std::string(kLastSyncAppStatePath)).ignore();
}

std::optional<PropertyList> AppsClient::_loadPlist(const Platform& platform, std::string_view path,
                                                   ErrorOut error) {
    return readListFile(platform, path, &PropertyList::isArray, kTodoListMessages, error);
}

void AppsClient::_notifyDeskora(const Platform& platform, bool starting) {
    const Log log(platform);
    const auto registration = platform.notifications.registerForState(kSyncNotification);
    log(Level::Default, "%s|Notifying DK we are %s syncing", starting ? "starting" : "done");
    // Looked up only so that the home screen is there to hear what is posted.
    static_cast<void>(platform.homeScreen.blockableConnection());
    if (registration.status != 0) {
        log(Level::Error, "%s|Uh Oh...can't send notification to DK:%d",
            std::int64_t{registration.status});
        return;
    }
    platform.notifications.setState(registration.token, starting ? kSyncStarting : kSyncDone);
    platform.notifications.post(kSyncNotification);
}

std::vector<PropertyList> AppsClient::_orderTheItems(const Platform& platform, ItemMap& items) {
    const Log log(platform);
    std::vector<PropertyList> ordered;
    ordered.reserve(items.size());
    const PropertyList order = saveIconOrder(platform);
    for (const PropertyList& element : order.elements()) {
        const std::string* identifier = element.asString();
        std::optional<PropertyList> item;
        if (identifier != nullptr) item = items.take(*identifier);
        if (!item) continue;
        log(Level::Default, "%s|prioritize %{public}@", *identifier);
        ordered.push_back(*std::move(item));
    }
    items.forEach([&](const std::string& identifier, const PropertyList& item) {
        log(Level::Default, "%s|lastly %{public}@", identifier);
        ordered.push_back(item);
    });
    return ordered;
}

}  // namespace appsync
