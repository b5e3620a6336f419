#include "simulation/services/SimulatedDeviceServices.h"

#include "simulation/recording/RecordedCall.h"
#include "simulation/services/SimulatedLogFacility.h"

namespace appsync {

PolicyAnswer SimulatedDevicePolicy::effectiveValue(PolicyFeature feature) {
    const bool installation = feature == PolicyFeature::AppInstallationAllowed;
    RecordedCall call(recorder_, "DevicePolicyService", "effectiveValue",
                      installation ? "AppInstallationAllowed" : "AppRemovalAllowed");
    const auto found = answers_.find(feature);
    const PolicyAnswer answer = found == answers_.end() ? PolicyAnswer::Unset : found->second;
    return call.result(answer, std::to_string(static_cast<int>(answer)));
}

class SimulatedBackupService::Manager : public BackupManager {
  public:
    explicit Manager(SimulatedBackupService& service) : service_(service) {}

    [[nodiscard]] bool restoreDataExists(const std::string& identifier) override {
        RecordedCall call(service_.recorder_, "BackupManager", "restoreDataExists", identifier);
        return call.result(service_.restoreData_.count(identifier) != 0);
    }

    void cancelApplicationRestore(const std::string& identifier) override {
        const RecordedCall call(service_.recorder_, "BackupManager", "cancelApplicationRestore",
                                identifier);
        service_.cancelled_.push_back(identifier);
        service_.restoreData_.erase(identifier);
        service_.recorder_.recordsChanged("the restore data of " + identifier, Persistence::OnDisk);
    }

  private:
    SimulatedBackupService& service_;
};

std::unique_ptr<BackupManager> SimulatedBackupService::makeManager() {
    RecordedCall call(recorder_, "BackupService", "makeManager");
    return call.result(std::make_unique<Manager>(*this), "a manager");
}

std::optional<PropertyList> SimulatedInstaller::lookupUninstalled() {
    RecordedCall call(recorder_, "InstallerService", "lookupUninstalled");
    return call.result(uninstalled_);
}

bool SimulatedInstaller::clearUninstalled(std::span<const std::string> identifiers) {
    std::string list;
    for (const std::string& identifier : identifiers)
        list += (list.empty() ? "" : " ") + identifier;
    RecordedCall call(recorder_, "InstallerService", "clearUninstalled", list);
    if (!clearable_) return call.result(false);
    for (const std::string& identifier : identifiers) {
        if (uninstalled_) uninstalled_->erase(identifier);
    }
    recorder_.recordsChanged("the list of uninstalled applications", Persistence::OnDisk);
    return call.result(true);
}

void SimulatedInstaller::addUninstalled(const std::string& identifier) {
    if (!uninstalled_ || !uninstalled_->isMap()) uninstalled_ = PropertyList::map();
    uninstalled_->set(identifier, PropertyList::map());
}

void SimulatedTransactionLog::initialize(const LogHandle& handle) {
    const auto* simulated = dynamic_cast<const SimulatedLogHandle*>(&handle);
    const std::string text = simulated != nullptr ? simulated->text() : "another log's handle";
    const RecordedCall call(recorder_, "InstallTransactionLog", "initialize", text);
    if (!handle_) handle_ = text;
}

void SimulatedTransactionLog::logStep(std::uint64_t kind, std::uint64_t party, std::uint64_t phase,
                                      bool success, std::string_view identifier,
                                      std::string_view description) {
    const RecordedCall call(recorder_, "InstallTransactionLog", "logStep", kind, party, phase,
                            success, identifier, description);
    records_.push_back("step " + callText(kind) + "|" + callText(party) + "|" + callText(phase) +
                       "|" + callText(success) + "|" + callText(identifier) + "|" +
                       callText(description));
}

void SimulatedTransactionLog::logScenario(std::string_view scenario, std::uint64_t step,
                                          bool success, std::string_view identifier,
                                          std::string_view description) {
    const RecordedCall call(recorder_, "InstallTransactionLog", "logScenario", scenario, step,
                            success, identifier, description);
    scenarios_.push_back(callText(scenario) + "|" + callText(identifier) + "|" + callText(success) +
                         "|" + callText(description));
    records_.push_back(callText(scenario) + "|" + callText(step) + "|" + callText(success) + "|" +
                       callText(identifier) + "|" + callText(description));
}

}  // namespace appsync
