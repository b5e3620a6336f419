#pragma once

#include <memory>
#include <string>
#include <utility>

#include "checked/BreachBook.h"
#include "platform/BackupService.h"
#include "platform/DevicePolicyService.h"
#include "platform/HomeScreenService.h"
#include "platform/InstallerService.h"
#include "platform/LogFacility.h"
#include "platform/absent/NoBackup.h"

namespace appsync {

/// Looks for handles that are not there, and gives one that is.
class CheckedLog final : public LogFacility {
  public:
    CheckedLog(LogFacility& log, BreachBook& book) : log_(log), book_(book) {}

    void write(const LogMessage& message) noexcept override { log_.write(message); }
    [[nodiscard]] std::unique_ptr<LogHandle> makeHandle(std::string_view subsystem,
                                                        std::string_view category) override {
        auto handle = log_.makeHandle(subsystem, category);
        if (handle != nullptr) return handle;
        book_.broken("platform/LogFacility.h", "A handle for a subsystem's own category.",
                     "makeHandle gave null");
        return std::make_unique<LogHandle>();
    }

  private:
    LogFacility& log_;
    BreachBook& book_;
};

/// Looks for managers that are not there, and gives one that has no data.
class CheckedBackup final : public BackupService {
  public:
    CheckedBackup(BackupService& backup, BreachBook& book) : backup_(backup), book_(book) {}

    [[nodiscard]] std::unique_ptr<BackupManager> makeManager() override {
        auto manager = backup_.makeManager();
        if (manager != nullptr) return manager;
        book_.broken("platform/BackupService.h", "Makes handles.", "makeManager gave null");
        return NoBackup().makeManager();
    }

  private:
    BackupService& backup_;
    BreachBook& book_;
};

/// Looks at the numbers of policy.
class CheckedPolicy final : public DevicePolicyService {
  public:
    CheckedPolicy(DevicePolicyService& policy, BreachBook& book) : policy_(policy), book_(book) {}

    [[nodiscard]] PolicyAnswer effectiveValue(PolicyFeature feature) override {
        const PolicyAnswer answer = policy_.effectiveValue(feature);
        if (answer != PolicyAnswer::Unset && answer != PolicyAnswer::Yes &&
            answer != PolicyAnswer::No) {
            book_.broken("platform/DevicePolicyService.h",
                         "The policy service's tri-state answer; its numbers.",
                         "the answer " + std::to_string(static_cast<int>(answer)));
        }
        return answer;
    }

  private:
    DevicePolicyService& policy_;
    BreachBook& book_;
};

/// Looks at the list of what was uninstalled.
class CheckedInstaller final : public InstallerService {
  public:
    CheckedInstaller(InstallerService& installer, BreachBook& book)
        : installer_(installer), book_(book) {}

    [[nodiscard]] std::optional<PropertyList> lookupUninstalled() override {
        auto list = installer_.lookupUninstalled();
        if (list && !list->isMap()) {
            book_.broken("platform/InstallerService.h",
                         "A map keyed by bundle identifier; nothing when the installer does not "
                         "answer.",
                         "lookupUninstalled gave something else");
        }
        return list;
    }
    [[nodiscard]] bool clearUninstalled(std::span<const std::string> identifiers) override {
        return installer_.clearUninstalled(identifiers);
    }

  private:
    InstallerService& installer_;
    BreachBook& book_;
};

/// Looks at assertions that were granted.
class CheckedHomeScreen final : public HomeScreenService {
  public:
    CheckedHomeScreen(HomeScreenService& homeScreen, BreachBook& book)
        : homeScreen_(homeScreen), book_(book) {}

    [[nodiscard]] std::shared_ptr<HomeScreenConnection> blockableConnection() override {
        return homeScreen_.blockableConnection();
    }
    [[nodiscard]] TerminationAssertionResult takeTerminationAssertion(
        const std::string& identifier, std::uint64_t reason) override {
        auto result = homeScreen_.takeTerminationAssertion(identifier, reason);
        if (result.outcome == TerminationAssertionResult::kGranted && result.assertion == nullptr) {
            book_.broken("platform/HomeScreenService.h",
                         "Else granted, with an assertion; several may hold one application.",
                         "an assertion was granted and is null");
        }
        return result;
    }

  private:
    HomeScreenService& homeScreen_;
    BreachBook& book_;
};

}  // namespace appsync
