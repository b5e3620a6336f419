#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/AppRegistry.h"
#include "recording/RecordedObservers.h"

namespace appsync {

class Recording;
class RecordedRegistryObserver;

class RecordedRegistry : public AppRegistry {
  public:
    RecordedRegistry(AppRegistry& inner, Recording& recording);
    ~RecordedRegistry() override;

    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override;
    bool isApplicationInstalled(const std::string& identifier) override;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override;
    std::shared_ptr<InstallProgressRecord> installProgress(const AppProxy& proxy,
                                                           std::uint64_t phase) override;
    void finishInstallPhase(InstallProgressRecord& record) override;
    Status installPackage(const FileURL& package, const PropertyList& options) override;
    Status installPlaceholderBundle(const FileURL& directory, const PropertyList& options) override;
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override;
    void addObserver(std::weak_ptr<AppRegistryObserver> observer) override;
    void removeObserver(const AppRegistryObserver* observer) override;

  private:
    AppRegistry& inner_;
    Recording& recording_;
    RecordedObservers<RecordedRegistryObserver> observers_;
};

}  // namespace appsync
