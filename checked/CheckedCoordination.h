#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <utility>

#include "checked/BreachBook.h"
#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/WorkQueues.h"

namespace appsync {

/// Looks at an install-coordination service: its errors, completions, and the observers of clients.
class CheckedCoordination final : public InstallCoordinatorService {
  public:
    CheckedCoordination(InstallCoordinatorService& service, WorkQueues& queues,
                        std::shared_ptr<BreachBook> book, std::chrono::nanoseconds patience)
        : service_(service), queues_(queues), book_(std::move(book)), patience_(patience) {}

    [[nodiscard]] bool isCoordinationEnabled() override {
        const bool isEnabled = service_.isCoordinationEnabled();
        if (isEnabled) book_->noteOthersInstall();
        return isEnabled;
    }
    [[nodiscard]] Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                                          CoordinationClient client, Creation creation) override;
    [[nodiscard]] std::shared_ptr<InstallCoordinator> existingCoordinator(
        const std::string& identifier, CoordinationClient client) override {
        return service_.existingCoordinator(identifier, client);
    }
    [[nodiscard]] std::shared_ptr<PathTransferPromise> makePathTransferPromise(
        const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
        std::uint64_t diskSpaceNeeded) override {
        return service_.makePathTransferPromise(name, client, path, diskSpaceNeeded);
    }
    [[nodiscard]] std::shared_ptr<OutOfBandPromise> makeOutOfBandPromise(
        const std::string& name, CoordinationClient client,
        std::uint64_t diskSpaceNeeded) override {
        return service_.makeOutOfBandPromise(name, client, diskSpaceNeeded);
    }
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> makeAppPlaceholder(
        const std::string& name, const std::string& identifier, std::uint64_t installType,
        CoordinationClient client) override {
        return service_.makeAppPlaceholder(name, identifier, installType, client);
    }
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override;
    [[nodiscard]] ErrorRecord userPresentableError(
        std::int64_t code, const std::optional<ErrorRecord>& underlying) override {
        return service_.userPresentableError(code, underlying);
    }
    [[nodiscard]] std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& serviceName, const std::set<CoordinationClient>& clients,
        std::weak_ptr<InstallCoordinatorObserver> delegate) override;

  private:
    InstallCoordinatorService& service_;
    WorkQueues& queues_;
    const std::shared_ptr<BreachBook> book_;
    const std::chrono::nanoseconds patience_;
};

}  // namespace appsync
