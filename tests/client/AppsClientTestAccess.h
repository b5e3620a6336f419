#pragma once

#include <cstdint>
#include <set>
#include <string>

#include "client/AppsClient.h"

namespace appsync {

/// What no operation of a client shows.
struct AppsClientTestAccess {
    static std::set<std::string>& kolmAppsToIgnore(AppsClient& client) {
        return client._kolmAppsToIgnore;
    }
    static std::set<std::string>& placeholdersForRestoringApps(AppsClient& client) {
        return client._placeholdersForRestoringApps;
    }
    static std::set<std::string>& updatingApps(AppsClient& client) { return client._updatingApps; }
    static std::set<std::string>& userCancelledApps(AppsClient& client) {
        return client._userCancelledApps;
    }
    static std::set<std::string> outstandingHFTTransfers(const AppsClient& client) {
        return client._outstandingHFTTransfers.contents();
    }
    static bool& finishedWaitingForPlaceHolderInstalls(AppsClient& client) {
        return client._finishedWaitingForPlaceHolderInstalls;
    }
    static void setUseInstallCoordinator(AppsClient& client, bool use) {
        client._useInstallCoordinator = use;
    }
    static std::int64_t restoringPlaceholderCount(const AppsClient& client) {
        return client._restoringPlaceholderCount;
    }
    static WaitGroup& restorePlaceHoldersWaitGroup(AppsClient& client) {
        return *client._restorePlaceHoldersWaitGroup;
    }
    static bool hasAppInstallObserver(const AppsClient& client) {
        return client._appInstallObserver != nullptr;
    }
    static bool hasUninstalledApps(const AppsClient& client) {
        return client._uninstalledApps.has_value();
    }
};

}  // namespace appsync
