#pragma once

#include <string>

namespace appsync {

struct ErrorRecord;
class TransferService;

/// What the process that loaded the plug-in answers. Callable on any thread; never fails.
class SyncHost {
  public:
    virtual ~SyncHost() = default;

    /// The identifier of the process's main bundle; "com.korvu.trd" inside the sync daemon itself.
    [[nodiscard]] virtual std::string mainBundleIdentifier() const = 0;

    /// The identifier of the plug-in's own bundle, with which every message begins.
    [[nodiscard]] virtual std::string pluginBundleIdentifier() const = 0;

    /// The host's recoverable-error test: true when the same operation may succeed if it is tried
    /// again (a transport that broke, for instance).
    [[nodiscard]] virtual bool isRecoverableError(const ErrorRecord& error) const = 0;

    /// The host's device service; null where there is none. It lives as long as the host.
    [[nodiscard]] virtual TransferService* transferService() { return nullptr; }
};

}  // namespace appsync
