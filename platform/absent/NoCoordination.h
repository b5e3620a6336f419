#pragma once

// platform/absent: the services that a device may do without, as classes that are ready to be
// handed to a client, one header for each. Each says what the plug-in does without the service.
// None has state; all are callable on any thread. Includes platform/ only.

#include "platform/InstallCoordinatorService.h"

namespace appsync {

/// No install coordination: the client installs directly, through the registry, and shows its own
/// placeholders until then. It asks `isCoordinationEnabled` once, and nothing else but an observer
/// when the host has started up, which it goes without. What it then lacks is what coordinators
/// give: an install that goes on when the process has ended, and somebody to put one application
/// before the others.
class NoCoordination final : public InstallCoordinatorService {
  public:
    [[nodiscard]] bool isCoordinationEnabled() override { return false; }

    [[nodiscard]] Coordinator coordinator(CoordinatorKind /*kind*/,
                                          const std::string& /*identifier*/,
                                          CoordinationClient /*client*/,
                                          Creation /*creation*/) override {
        return {nullptr, false, off()};
    }
    [[nodiscard]] std::shared_ptr<InstallCoordinator> existingCoordinator(
        const std::string& /*identifier*/, CoordinationClient /*client*/) override {
        return nullptr;
    }
    [[nodiscard]] std::shared_ptr<PathTransferPromise> makePathTransferPromise(
        const std::string& /*name*/, CoordinationClient /*client*/,
        const std::optional<FileURL>& /*path*/, std::uint64_t /*diskSpaceNeeded*/) override {
        return nullptr;
    }
    [[nodiscard]] std::shared_ptr<OutOfBandPromise> makeOutOfBandPromise(
        const std::string& /*name*/, CoordinationClient /*client*/,
        std::uint64_t /*diskSpaceNeeded*/) override {
        return nullptr;
    }
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> makeAppPlaceholder(
        const std::string& /*name*/, const std::string& /*identifier*/,
        std::uint64_t /*installType*/, CoordinationClient /*client*/) override {
        return nullptr;
    }
    /// The completion gets an error, before this returns: there is no other thread to call it.
    void uninstallApp(const std::string& /*identifier*/, UninstallCompletion completion) override {
        const ErrorRecord error = off();
        completion(&error);
    }
    [[nodiscard]] ErrorRecord userPresentableError(
        std::int64_t code, const std::optional<ErrorRecord>& underlying) override {
        return underlying ? *underlying
                          : ErrorRecord::make(kSyncErrorDomain, code, "The install failed");
    }
    [[nodiscard]] std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& /*serviceName*/, const std::set<CoordinationClient>& /*clients*/,
        std::weak_ptr<InstallCoordinatorObserver> /*delegate*/) override {
        return nullptr;
    }

  private:
    static ErrorRecord off() {
        return ErrorRecord::make(kPosixErrorDomain, kPosixInvalidArgument,
                                 "This device does not coordinate installs");
    }
};

}  // namespace appsync
