#pragma once

// device/registry: the platform's `AppRegistry`. `DeviceRegistry` (this header) answers from the
// database what is installed and turns installs, placeholders and removals into operations of
// device/install; `RegistryObservers` (of system/) tells observers of the installs under way.
// Includes install, database, values and system. Called by the plug-in through platform/ and by
// `Device`.

#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>

#include "device/install/InstallContext.h"
#include "platform/AppRegistry.h"
#include "system/RegistryObservers.h"

namespace appsync {

/// The registry of a device: what is installed is what its database says, and the containers on
/// disk hold it. A failure of the database reads as "nothing there"; `Device::databaseFailure`
/// tells of it.
///
/// The uninstall without options that follows a failed install is the clearing up after it: it
/// takes the placeholder of a sync away and nothing else, so that what was there before the install
/// stays.
class DeviceRegistry final : public AppRegistry {
  public:
    explicit DeviceRegistry(const InstallContext& context);

    [[nodiscard]] std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                                             Placeholders placeholders) override;
    [[nodiscard]] bool isApplicationInstalled(const std::string& identifier) override;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override;

    [[nodiscard]] std::shared_ptr<InstallProgressRecord> installProgress(
        const AppProxy& proxy, std::uint64_t phase) override;
    void finishInstallPhase(InstallProgressRecord& record) override;

    Status installPackage(const FileURL& package, const PropertyList& options) override;
    Status installPlaceholderBundle(const FileURL& directory, const PropertyList& options) override;
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override;

    void addObserver(std::weak_ptr<AppRegistryObserver> observer) override;
    void removeObserver(const AppRegistryObserver* observer) override;

    /// The installs under way may have changed.
    void touch() { observers_.touch(); }

  private:
    [[nodiscard]] InstallsUnderWay installsUnderWay();
    void noteInstall(const std::string& identifier, const Status& status);
    [[nodiscard]] bool takeFailedInstall(const std::string& identifier);

    const InstallContext context_;
    RegistryObservers observers_;
    std::mutex mutex_;
    /// Whose last install has failed, until an uninstall follows. Guarded by `mutex_`.
    std::set<std::string> failedInstalls_;
};

}  // namespace appsync
