#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>

#include "platform/BackupService.h"
#include "platform/DevicePolicyService.h"
#include "platform/HomeScreenService.h"
#include "platform/IconRenderer.h"
#include "platform/InstallTransactionLog.h"
#include "platform/InstallerService.h"

// The small services of a device whose calls go to another, which is borrowed. For wrappers that
// change or watch some of the calls.

namespace appsync {

class ForwardingDevicePolicy : public DevicePolicyService {
  public:
    using Service = DevicePolicyService;

    explicit ForwardingDevicePolicy(DevicePolicyService& target) : target_(target) {}
    [[nodiscard]] PolicyAnswer effectiveValue(PolicyFeature feature) override {
        return target_.effectiveValue(feature);
    }

  protected:
    [[nodiscard]] DevicePolicyService& target() { return target_; }

  private:
    DevicePolicyService& target_;
};

class ForwardingInstaller : public InstallerService {
  public:
    using Service = InstallerService;

    explicit ForwardingInstaller(InstallerService& target) : target_(target) {}
    [[nodiscard]] std::optional<PropertyList> lookupUninstalled() override {
        return target_.lookupUninstalled();
    }
    [[nodiscard]] bool clearUninstalled(std::span<const std::string> identifiers) override {
        return target_.clearUninstalled(identifiers);
    }

  protected:
    [[nodiscard]] InstallerService& target() { return target_; }

  private:
    InstallerService& target_;
};

class ForwardingBackupManager : public BackupManager {
  public:
    explicit ForwardingBackupManager(std::unique_ptr<BackupManager> target)
        : target_(std::move(target)) {}
    [[nodiscard]] bool restoreDataExists(const std::string& identifier) override {
        return target_->restoreDataExists(identifier);
    }
    void cancelApplicationRestore(const std::string& identifier) override {
        target_->cancelApplicationRestore(identifier);
    }

  protected:
    const std::unique_ptr<BackupManager> target_;
};

class ForwardingBackupService : public BackupService {
  public:
    using Service = BackupService;

    explicit ForwardingBackupService(BackupService& target) : target_(target) {}
    [[nodiscard]] std::unique_ptr<BackupManager> makeManager() override {
        return target_.makeManager();
    }

  protected:
    [[nodiscard]] BackupService& target() { return target_; }

  private:
    BackupService& target_;
};

class ForwardingHomeScreenConnection : public HomeScreenConnection {
  public:
    explicit ForwardingHomeScreenConnection(std::shared_ptr<HomeScreenConnection> target)
        : target_(std::move(target)) {}
    bool setIconState(ByteView state) override { return target_->setIconState(state); }
    [[nodiscard]] std::optional<Bytes> flattenedIconState(std::uint64_t variant) override {
        return target_->flattenedIconState(variant);
    }

  protected:
    const std::shared_ptr<HomeScreenConnection> target_;
};

class ForwardingHomeScreen : public HomeScreenService {
  public:
    using Service = HomeScreenService;

    explicit ForwardingHomeScreen(HomeScreenService& target) : target_(target) {}
    [[nodiscard]] std::shared_ptr<HomeScreenConnection> blockableConnection() override {
        return target_.blockableConnection();
    }
    [[nodiscard]] TerminationAssertionResult takeTerminationAssertion(
        const std::string& identifier, std::uint64_t reason) override {
        return target_.takeTerminationAssertion(identifier, reason);
    }

  protected:
    [[nodiscard]] HomeScreenService& target() { return target_; }

  private:
    HomeScreenService& target_;
};

class ForwardingTransactionLog : public InstallTransactionLog {
  public:
    using Service = InstallTransactionLog;

    explicit ForwardingTransactionLog(InstallTransactionLog& target) : target_(target) {}
    void initialize(const LogHandle& handle) override { target_.initialize(handle); }
    void logStep(std::uint64_t kind, std::uint64_t party, std::uint64_t phase, bool success,
                 std::string_view identifier, std::string_view description) override {
        target_.logStep(kind, party, phase, success, identifier, description);
    }
    void logScenario(std::string_view scenario, std::uint64_t step, bool success,
                     std::string_view identifier, std::string_view description) override {
        target_.logScenario(scenario, step, success, identifier, description);
    }

  protected:
    [[nodiscard]] InstallTransactionLog& target() { return target_; }

  private:
    InstallTransactionLog& target_;
};

class ForwardingIconRenderer : public IconRenderer {
  public:
    using Service = IconRenderer;

    explicit ForwardingIconRenderer(IconRenderer& target) : target_(target) {}
    [[nodiscard]] std::unique_ptr<AppBundle> openBundle(const FileURL& url) override {
        return target_.openBundle(url);
    }
    [[nodiscard]] std::unique_ptr<IconImage> homeScreenIcon(const AppBundle& bundle) override {
        return target_.homeScreenIcon(bundle);
    }
    [[nodiscard]] std::unique_ptr<ImageDestination> createImageDestination(
        std::string_view typeIdentifier, std::size_t imageCount, Bytes& buffer) override {
        return target_.createImageDestination(typeIdentifier, imageCount, buffer);
    }

  protected:
    [[nodiscard]] IconRenderer& target() { return target_; }

  private:
    IconRenderer& target_;
};

}  // namespace appsync
