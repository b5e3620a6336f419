#pragma once

#include <string>
#include <string_view>

#include "host/watch/TransferQueue.h"
#include "platform/SyncHost.h"

namespace appsync {

/// The sync daemon that loads the plug-in.
class SyncDaemon : public SyncHost {
  public:
    /// Which process loads the plug-in: the sync daemon, or the one that restores backups.
    enum class Process { Daemon, Restore };

    explicit SyncDaemon(Process process = Process::Daemon) : process_(process) {}

    [[nodiscard]] std::string mainBundleIdentifier() const override {
        return process_ == Process::Daemon ? "com.korvu.trd" : "com.korvu.bakvia";
    }
    [[nodiscard]] std::string pluginBundleIdentifier() const override {
        return "com.korvu.trd.appsync";
    }

    /// Recoverable is what a later try may not meet again: a transfer that was interrupted or cut
    /// short, and those failures of the operating system that pass (a full disk, a read error, no
    /// more memory or descriptors, a call that was interrupted or timed out). Everything else is
    /// not: a package that is missing or refused stays so.
    [[nodiscard]] bool isRecoverableError(const ErrorRecord& error) const override;

    [[nodiscard]] TransferService* transferService() override { return &transfers_; }
    /// The same, for the session whose transfers they are.
    [[nodiscard]] TransferQueue& transfers() { return transfers_; }

  private:
    const Process process_;
    TransferQueue transfers_;
};

}  // namespace appsync
