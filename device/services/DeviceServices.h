#pragma once

// device/services: the platform's services that are little more than a table of the database: the
// list of uninstalled applications, policy, data that a restore expects, the transaction log. All
// of them are in this header. A new service of that kind goes here; one that has threads or files
// of its own gets a room. Includes device/database and device/values. Made by `Device`;
// coordination asks the policy.

#include <string>
#include <vector>

#include "device/values/DeviceRecords.h"
#include "platform/BackupService.h"
#include "platform/DevicePolicyService.h"
#include "platform/InstallTransactionLog.h"
#include "platform/InstallerService.h"
#include "platform/Result.h"

namespace appsync {

class DeviceDatabase;

// The services of a device that are little more than a table of its database, which outlives them.
// A failure of the database is told by `Device::databaseFailure`.

/// The list of applications that a person removed.
class DeviceInstaller final : public InstallerService {
  public:
    explicit DeviceInstaller(DeviceDatabase& database) : database_(database) {}

    /// Each value is a map with "UninstallDate" and, where it is known, `BundleVersionKey`.
    [[nodiscard]] std::optional<PropertyList> lookupUninstalled() override;
    [[nodiscard]] bool clearUninstalled(std::span<const std::string> identifiers) override;

  private:
    DeviceDatabase& database_;
};

/// What is set on the device. Each answer is read anew: a person may change it at any time.
class DevicePolicy final : public DevicePolicyService {
  public:
    explicit DevicePolicy(DeviceDatabase& database) : database_(database) {}

    /// Unset when the database cannot tell.
    [[nodiscard]] PolicyAnswer effectiveValue(PolicyFeature feature) override;

    [[nodiscard]] Result<DeviceSettings> settings();
    Status change(const DeviceSettingsChange& change);

  private:
    DeviceDatabase& database_;
};

/// Knows for which applications data to restore is yet to come.
class DeviceBackup final : public BackupService {
  public:
    explicit DeviceBackup(DeviceDatabase& database) : database_(database) {}

    [[nodiscard]] std::unique_ptr<BackupManager> makeManager() override;

    Status setRestoreDataExpected(const std::string& identifier, bool expected);
    Status expectRestoreData(const std::vector<std::string>& identifiers);

  private:
    DeviceDatabase& database_;
};

/// The transaction log: written a moment later, read whole.
class DeviceHistory final : public InstallTransactionLog {
  public:
    explicit DeviceHistory(DeviceDatabase& database) : database_(database) {}

    void initialize(const LogHandle& handle) override;
    void logStep(std::uint64_t kind, std::uint64_t party, std::uint64_t phase, bool success,
                 std::string_view identifier, std::string_view description) override;
    void logScenario(std::string_view scenario, std::uint64_t step, bool success,
                     std::string_view identifier, std::string_view description) override;

    /// The last `limit` records, oldest first.
    [[nodiscard]] Result<std::vector<HistoryRecord>> records(std::size_t limit);

  private:
    void append(HistoryRecord record);

    DeviceDatabase& database_;
};

}  // namespace appsync
