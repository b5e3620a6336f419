#pragma once

#include <string>

namespace appsync {

struct ErrorRecord;

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
};

}  // namespace appsync
