#pragma once

// The small services, each handing everything on to the platform's own.

#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/BackupService.h"
#include "platform/DevicePolicyService.h"
#include "platform/HomeScreenService.h"
#include "platform/IconRenderer.h"
#include "platform/InstallTransactionLog.h"
#include "platform/InstallerService.h"
#include "platform/LogFacility.h"
#include "platform/Notifications.h"
#include "platform/SyncHost.h"
#include "platform/TransferService.h"

namespace appsync {

class Recording;

class RecordedTransfers : public TransferService {
  public:
    RecordedTransfers(TransferService* inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    bool canCancelTransfers() const override;
    void cancelTransferForFailedAsset(const SyncAsset& asset) override;
    bool canPrioritizeAssets() const override;
    void prioritizeAsset(const SyncAsset& asset, PrioritizeCompletion completion) override;

  private:
    TransferService* const inner_;
    Recording& recording_;
};

/// The two identifiers stand in the header of the recording.
class RecordedHost : public SyncHost {
  public:
    RecordedHost(SyncHost& inner, Recording& recording)
        : inner_(inner), recording_(recording), transfers_(inner.transferService(), recording) {}

    std::string mainBundleIdentifier() const override { return inner_.mainBundleIdentifier(); }
    std::string pluginBundleIdentifier() const override { return inner_.pluginBundleIdentifier(); }
    bool isRecoverableError(const ErrorRecord& error) const override;
    TransferService* transferService() override;

  private:
    SyncHost& inner_;
    Recording& recording_;
    RecordedTransfers transfers_;
};

class RecordedLog : public LogFacility {
  public:
    /// The identifier is the one with which the plug-in's messages begin.
    RecordedLog(LogFacility& inner, std::string ownIdentifier, Recording& recording)
        : inner_(inner), ownIdentifier_(std::move(ownIdentifier)), recording_(recording) {}

    void write(const LogMessage& message) noexcept override;
    std::unique_ptr<LogHandle> makeHandle(std::string_view subsystem,
                                          std::string_view category) override;

  private:
    LogFacility& inner_;
    const std::string ownIdentifier_;
    Recording& recording_;
};

class RecordedInstaller : public InstallerService {
  public:
    RecordedInstaller(InstallerService& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    std::optional<PropertyList> lookupUninstalled() override;
    bool clearUninstalled(std::span<const std::string> identifiers) override;

  private:
    InstallerService& inner_;
    Recording& recording_;
};

class RecordedPolicy : public DevicePolicyService {
  public:
    RecordedPolicy(DevicePolicyService& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    PolicyAnswer effectiveValue(PolicyFeature feature) override;

  private:
    DevicePolicyService& inner_;
    Recording& recording_;
};

class RecordedBackup : public BackupService {
  public:
    RecordedBackup(BackupService& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    std::unique_ptr<BackupManager> makeManager() override;

  private:
    BackupService& inner_;
    Recording& recording_;
};

class RecordedHomeScreen : public HomeScreenService {
  public:
    RecordedHomeScreen(HomeScreenService& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    std::shared_ptr<HomeScreenConnection> blockableConnection() override;
    TerminationAssertionResult takeTerminationAssertion(const std::string& identifier,
                                                        std::uint64_t reason) override;

  private:
    HomeScreenService& inner_;
    Recording& recording_;
};

class RecordedIcons : public IconRenderer {
  public:
    RecordedIcons(IconRenderer& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    std::unique_ptr<AppBundle> openBundle(const FileURL& url) override;
    std::unique_ptr<IconImage> homeScreenIcon(const AppBundle& bundle) override;
    std::unique_ptr<ImageDestination> createImageDestination(std::string_view typeIdentifier,
                                                             std::size_t imageCount,
                                                             Bytes& buffer) override;

  private:
    IconRenderer& inner_;
    Recording& recording_;
};

class RecordedTransactions : public InstallTransactionLog {
  public:
    RecordedTransactions(InstallTransactionLog& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    void initialize(const LogHandle& handle) override;
    void logStep(std::uint64_t kind, std::uint64_t party, std::uint64_t phase, bool success,
                 std::string_view identifier, std::string_view description) override;
    void logScenario(std::string_view scenario, std::uint64_t step, bool success,
                     std::string_view identifier, std::string_view description) override;

  private:
    InstallTransactionLog& inner_;
    Recording& recording_;
};

class RecordedNotifications : public NamedNotifications {
  public:
    RecordedNotifications(NamedNotifications& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    Registration registerForState(std::string_view name) override;
    void setState(int token, std::uint64_t state) override;
    void post(std::string_view name) override;

  private:
    NamedNotifications& inner_;
    Recording& recording_;
};

class RecordedNotificationCenter : public NotificationCenter {
  public:
    RecordedNotificationCenter(NotificationCenter& inner, Recording& recording)
        : inner_(inner), recording_(recording) {}

    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override;
    void removeObserver(const void* observer, std::string_view name) override;
    void post(std::string_view name) override;

  private:
    struct StandIn;
    static void hear(void* standIn);

    NotificationCenter& inner_;
    Recording& recording_;
    std::mutex mutex_;
    std::vector<std::shared_ptr<StandIn>> standIns_;  // guarded by mutex_
};

}  // namespace appsync
