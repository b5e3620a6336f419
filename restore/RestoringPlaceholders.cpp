#include "client/AppsClient.h"

namespace appsync {

void AppsClient::relocantSetPlaceHolderPromiseForRestoreAppBundle(const std::string& identifier) {
    _restoreQueue->sync([&] {
        if (_placeholdersForRestoringApps.contains(identifier)) return;
        _restorePlaceHoldersWaitGroup->enter();
        ++_restoringPlaceholderCount;
        _placeholdersForRestoringApps.insert(identifier);
        log_(Level::Default,
             "%s|Relocant will wait for TS to install placeholder for %{public}@, "
             "_restoringPlaceholderCount %lld",
             identifier, _restoringPlaceholderCount.load());
    });
}

void AppsClient::relocantCancelledCoordinatorForRestoreAppBundle(const std::string& identifier) {
    _restoreQueue->sync([&] {
        if (!_placeholdersForRestoringApps.contains(identifier)) return;
        stopAwaitingPlaceholder(identifier);
        log_(Level::Default,
             "%s|Relocant cancelled coordinator for restoring app bundle %{public}@ "
             "_restoringPlaceholderCount %lld",
             identifier, _restoringPlaceholderCount.load());
    });
}

void AppsClient::tsDidInstallPlaceHolderForAppBundle(const std::string& identifier) {
    _restoreQueue->sync([&] {
        if (_finishedWaitingForPlaceHolderInstalls) return;
        if (!_placeholdersForRestoringApps.contains(identifier)) {
            log_(Level::Error,
                 "%s|Ignoring notification from TS about installing placeholder for %{public}@",
                 identifier);
            return;
        }
        stopAwaitingPlaceholder(identifier);
        log_(Level::Default,
             "%s|TS finished installing placeholder for %{public}@, _restoringPlaceholderCount "
             "%lld",
             identifier, _restoringPlaceholderCount.load());
    });
}

// On _restoreQueue.
void AppsClient::stopAwaitingPlaceholder(const std::string& identifier) {
    _restorePlaceHoldersWaitGroup->leave();
    --_restoringPlaceholderCount;
    _placeholdersForRestoringApps.erase(identifier);
}

}  // namespace appsync
