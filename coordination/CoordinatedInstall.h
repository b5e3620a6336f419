#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "client/Log.h"
#include "coordination/PieceLog.h"
#include "platform/InstallPlaceholder.h"

namespace appsync {

class AppsClient;
class InstallCoordinator;
struct Platform;
struct SyncAsset;

/// One run of `prepareAppForInstallUsingCoordination`.
class CoordinatedInstall {
  public:
    /// Reads the asset's side files. Borrows everything.
    CoordinatedInstall(AppsClient& client, const Platform& platform, const SyncAsset& asset,
                       bool existingApp);

    /// Sets up the coordinator, whatever it lacks. False when it cannot be; what was made is
    /// cancelled then. Called once.
    bool run();

  private:
    bool prepare();
    bool addInstallOptions();
    bool addODRAssetPromises();
    bool addAppAssetPromise();
    bool addPlaceholderPromise();
    void makePlaceholder();
    [[nodiscard]] std::uint64_t copyIcon(const std::string& iconPath);
    void configurePlaceholder();
    bool setPlaceholderAttributes();
    bool setPlaceholderMetadata();
    void setPlaceholderComplete();
    void cancel();

    AppsClient& client_;
    const Platform& platform_;
    const Log log_;

    // What the asset says. The info dictionary is absent when it cannot be read.
    const SyncAsset& asset_;
    const std::optional<PropertyList> info_;
    const StoreMetadata storeMetadata_;
    const bool existingApp_;

    // What has been made so far.
    std::shared_ptr<InstallCoordinator> coordinator_;
    // Absent where the coordinator had its install options already.
    std::optional<StoreMetadata> storeRecord_;
    std::shared_ptr<InstallPlaceholder> placeholder_;
    bool isPlaceholderAccepted_ = false;
    PieceLog pieces_;
};

}  // namespace appsync
