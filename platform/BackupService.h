#pragma once

#include <memory>
#include <string>

namespace appsync {

/// A client's handle on the backup service. Callable on any thread; never fails visibly.
class BackupManager {
  public:
    virtual ~BackupManager() = default;

    /// Whether the service holds data to restore for the application.
    [[nodiscard]] virtual bool restoreDataExists(const std::string& identifier) = 0;

    /// Gives the application's restore up.
    virtual void cancelApplicationRestore(const std::string& identifier) = 0;
};

/// Makes handles. Callable on any thread.
class BackupService {
  public:
    virtual ~BackupService() = default;
    [[nodiscard]] virtual std::unique_ptr<BackupManager> makeManager() = 0;
};

}  // namespace appsync
