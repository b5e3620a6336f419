#pragma once

#include "platform/BackupService.h"

namespace appsync {

/// No backup service: there is no data to restore for any application. A restored application is
/// installed as soon as its package is there, without waiting for its data.
class NoBackup final : public BackupService {
  public:
    [[nodiscard]] std::unique_ptr<BackupManager> makeManager() override {
        return std::make_unique<Manager>();
    }

  private:
    class Manager final : public BackupManager {
      public:
        [[nodiscard]] bool restoreDataExists(const std::string& /*identifier*/) override {
            return false;
        }
        void cancelApplicationRestore(const std::string& /*identifier*/) override {}
    };
};

}  // namespace appsync
