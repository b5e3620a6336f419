#pragma once

// simulation/services: one file for each service of platform/ that is neither files nor
// coordination; those that only answer or only take note (policy, backup, installer, transaction
// log) share this one. Each is the interface, which is recorded, and below it what a test sets and
// looks at, which is not. SimulatedAppRegistry.h is the large one: it installs, keeps progress and
// calls observers. A new service of platform/ gets its file here, its member in SimulatedPlatform.h
// and its names in KnownCalls.cpp. Includes files, recording and platform/.

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/BackupService.h"
#include "platform/DevicePolicyService.h"
#include "platform/InstallTransactionLog.h"
#include "platform/InstallerService.h"
#include "simulation/recording/Recorder.h"

// The services that only answer or only take note, each with what the test sets and looks at (that
// is not recorded).

namespace appsync {

/// Everything is unset until the test sets it.
class SimulatedDevicePolicy : public DevicePolicyService {
  public:
    explicit SimulatedDevicePolicy(Recorder& recorder) : recorder_(recorder) {}
    [[nodiscard]] PolicyAnswer effectiveValue(PolicyFeature feature) override;

    void set(PolicyFeature feature, PolicyAnswer answer) { answers_[feature] = answer; }

  private:
    Recorder& recorder_;
    std::map<PolicyFeature, PolicyAnswer> answers_;
};

/// Holds no restore data until the test adds some.
class SimulatedBackupService : public BackupService {
  public:
    explicit SimulatedBackupService(Recorder& recorder) : recorder_(recorder) {}
    [[nodiscard]] std::unique_ptr<BackupManager> makeManager() override;

    void addRestoreData(const std::string& identifier) { restoreData_.insert(identifier); }
    void setRestoreData(std::set<std::string> identifiers) {
        restoreData_ = std::move(identifiers);
    }
    [[nodiscard]] const std::set<std::string>& restoreData() const { return restoreData_; }
    /// The identifiers whose restore was cancelled, in order. Their data is gone.
    [[nodiscard]] const std::vector<std::string>& cancelled() const { return cancelled_; }

  private:
    class Manager;

    Recorder& recorder_;
    std::set<std::string> restoreData_;
    std::vector<std::string> cancelled_;
};

/// The list of uninstalled applications, empty at first.
class SimulatedInstaller : public InstallerService {
  public:
    explicit SimulatedInstaller(Recorder& recorder) : recorder_(recorder) {}
    [[nodiscard]] std::optional<PropertyList> lookupUninstalled() override;
    [[nodiscard]] bool clearUninstalled(std::span<const std::string> identifiers) override;

    void addUninstalled(const std::string& identifier);
    /// The answer of every look-up, as it is; nothing: the installer does not answer.
    void setUninstalled(std::optional<PropertyList> map) { uninstalled_ = std::move(map); }
    /// Whether the list can be cleared; at first it can.
    void setClearable(bool clearable) { clearable_ = clearable; }
    [[nodiscard]] const std::optional<PropertyList>& uninstalled() const { return uninstalled_; }

  private:
    Recorder& recorder_;
    std::optional<PropertyList> uninstalled_ = PropertyList::map();
    bool clearable_ = true;
};

/// Keeps every record.
class SimulatedTransactionLog : public InstallTransactionLog {
  public:
    explicit SimulatedTransactionLog(Recorder& recorder) : recorder_(recorder) {}
    void initialize(const LogHandle& handle) override;
    void logStep(std::uint64_t kind, std::uint64_t party, std::uint64_t phase, bool success,
                 std::string_view identifier, std::string_view description) override;
    void logScenario(std::string_view scenario, std::uint64_t step, bool success,
                     std::string_view identifier, std::string_view description) override;

    /// "Asset install|0|yes|com.example.a|assertion succeeded" or "step 3|1|2|no|...", in order.
    [[nodiscard]] const std::vector<std::string>& records() const { return records_; }
    /// Those of `logScenario` as "scenario|identifier|yes|description".
    [[nodiscard]] const std::vector<std::string>& scenarios() const { return scenarios_; }
    /// "subsystem/category" of the handle that it was initialised with; nothing before.
    [[nodiscard]] const std::optional<std::string>& handle() const { return handle_; }

  private:
    Recorder& recorder_;
    std::optional<std::string> handle_;
    std::vector<std::string> records_;
    std::vector<std::string> scenarios_;
};

}  // namespace appsync
