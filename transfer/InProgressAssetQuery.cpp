#include "transfer/InProgressAssetQuery.h"

#include <cstdint>

#include "platform/InstallProgressRecord.h"
#include "platform/Platform.h"
#include "platform/PropertyList.h"
#include "platform/WorkQueues.h"
#include "transfer/InstallNames.h"

namespace appsync {

namespace {

struct InstallStatus {
    std::uint64_t type;
    std::uint64_t state;
    std::uint64_t phase;
};

// A store download is in progress already while it loads, every other install only once it
// installs.
bool isInProgress(const InstallStatus& status) {
    if (status.state != kInstallStateActive) return false;
    const bool installs =
        status.type != kInstallTypeRestore && status.phase == kInstallPhaseInstalling;
    const bool loadsFromStore =
        status.type == kInstallTypeStoreDownload && status.phase == kInstallPhaseLoading;
    return installs || loadsFromStore;
}

// A restore counts in both of its early phases.
bool isRestoring(const InstallStatus& status) {
    return status.type == kInstallTypeRestore && status.state == kInstallStateActive &&
           (status.phase == kInstallPhaseLoading || status.phase == kInstallPhaseInstalling);
}

PropertyList identifiersOf(const std::vector<AppProxy>& proxies) {
    PropertyList identifiers = PropertyList::array(proxies.size());
    for (const AppProxy& proxy : proxies) identifiers.append(proxy.applicationIdentifier);
    return identifiers;
}

}  // namespace

void InProgressAssetQuery::currentInProgressAssetIDs(const Platform& platform,
                                                     Identifiers& inProgressAssetIDs,
                                                     Identifiers& restoringAssetIDs) {
    inProgressAssetIDs.reset();
    restoringAssetIDs.reset();
    const auto query = std::make_shared<InProgressAssetQuery>(platform);
    platform.registry.addObserver(query);
    if (query->_fetchResults()) {
        inProgressAssetIDs = query->_inProgressAssetIDs;
        restoringAssetIDs = query->_restoringAssetIDs;
    }
    platform.registry.removeObserver(query.get());
}

InProgressAssetQuery::InProgressAssetQuery(const Platform& platform)
    : _waitForInitialObservationData(platform.queues.makeSemaphore(0)),
      registry_(platform.registry),
      log_(platform) {}

InProgressAssetQuery::~InProgressAssetQuery() = default;

bool InProgressAssetQuery::_fetchResults() {
    log_(Level::Default,
         "%s|Waiting for -applicationInstallsArePrioritized:arePaused: to complete...");
    if (!_waitForInitialObservationData->wait()) {
        log_(Level::Error, "%s|Query for in progress assets timed out");
        return false;
    }
    log_(Level::Default, "%s|Wait completed");
    return true;
}

void InProgressAssetQuery::applicationInstallsArePrioritized(
    const std::vector<AppProxy>& prioritized, const std::vector<AppProxy>& paused) {
    log_.applications(Level::Default, "%s|prioritized proxies %{public}@ paused proxies %{public}@",
                      identifiersOf(prioritized), identifiersOf(paused));
    if (_inProgressAssetIDs) return;
    _inProgressAssetIDs.emplace();
    _restoringAssetIDs.emplace();
    sortReport(prioritized);
    log_(Level::Default, "%s|signaling semaphore");
    _waitForInitialObservationData->signal();
}

void InProgressAssetQuery::sortReport(const std::vector<AppProxy>& prioritized) {
    if (prioritized.empty()) log_(Level::Default, "%s|No assets currently in progress.");
    for (const AppProxy& proxy : prioritized) sortInstall(proxy);
}

void InProgressAssetQuery::sortInstall(const AppProxy& proxy) {
    const std::string& identifier = proxy.applicationIdentifier;
    if (!proxy.state.placeholder) {
        log_(Level::Default, "%s|No placeholder for asset identifier %{public}@", identifier);
        return;
    }
    const auto progress = registry_.installProgress(proxy, kWholeInstall);
    if (progress == nullptr) {
        log_(Level::Default, "%s|No install progress found for asset identifier %{public}@",
             identifier);
        return;
    }
    const InstallStatus status{proxy.installType, progress->installState(),
                               progress->installPhase()};
    log_(Level::Default,
         "%s|Got install type=%{public}@ state=%{public}@ phase=%{public}@ for %{public}@",
         installTypeName(status.type), installStateName(status.state),
         installPhaseName(status.phase), identifier);
    if (isInProgress(status)) {
        _inProgressAssetIDs->push_back(identifier);
    } else if (isRestoring(status)) {
        _restoringAssetIDs->push_back(identifier);
    }
}

void InProgressAssetQuery::applicationInstallsDidCancel(const std::vector<AppProxy>&) {}

}  // namespace appsync
