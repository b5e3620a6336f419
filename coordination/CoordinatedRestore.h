#pragma once

#include <memory>

#include "client/Log.h"
#include "coordination/PieceLog.h"
#include "platform/PropertyList.h"
#include "restore/RestoredApp.h"

namespace appsync {

class AppsClient;
class InstallCoordinator;
class InstallPlaceholder;
enum class CoordinatorKind;
struct Platform;

/// One run of `prepareAppForRestoreUsingCoordination`.
class CoordinatedRestore {
  public:
    /// Borrows everything, what the application lends too.
    CoordinatedRestore(AppsClient& client, const Platform& platform, const RestoredApp& app);

    // Each sets up the application's restoring coordinator, whatever it lacks. False when it cannot
    // be; what was made is cancelled then, and the placeholder no longer awaited. One is called,
    // once.

    /// `_prepareDemotedAppForRestoreWithBundleId`
    bool runDemoted();
    /// `_prepareNonDemotedAppForRestoreWithBundleId`
    bool runNonDemoted();

  private:
    bool begin(CoordinatorKind kind);
    bool readMetadata();
    [[nodiscard]] bool isLeftToAppStore() const;
    bool addPromises();
    bool addUserDataPromise();
    bool addPlaceholder();
    bool leaveToAppStore();
    void giveUp();

    AppsClient& client_;
    const Platform& platform_;
    const Log log_;
    const RestoredApp app_;
    /// The store metadata, once it has been parsed.
    PropertyList metadata_;

    // What has been made so far.
    std::shared_ptr<InstallCoordinator> coordinator_;
    /// One that the coordinator did not take.
    std::shared_ptr<InstallPlaceholder> refusedPlaceholder_;
    PieceLog pieces_;
};

}  // namespace appsync
