#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <utility>

#include "checked/BreachBook.h"
#include "checked/CoordinatorObservers.h"
#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/WorkQueues.h"

namespace appsync {

/// Looks at an install-coordination service: its errors, completions, the handles that it makes,
/// and how it calls observers.
class CheckedCoordination final : public InstallCoordinatorService {
  public:
    CheckedCoordination(InstallCoordinatorService& service, WorkQueues& queues,
                        std::shared_ptr<BreachBook> book, std::chrono::nanoseconds patience)
        : service_(service),
          queues_(queues),
          patience_(patience),
          book_(std::move(book)),
          watch_(std::make_shared<CoordinationWatch>(book_, queues, patience)),
          observers_(std::make_shared<CoordinatorObservers>(watch_)) {}

    [[nodiscard]] bool isCoordinationEnabled() override;
    [[nodiscard]] Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                                          CoordinationClient client, Creation creation) override;
    [[nodiscard]] std::shared_ptr<InstallCoordinator> existingCoordinator(
        const std::string& identifier, CoordinationClient client) override;
    [[nodiscard]] std::shared_ptr<PathTransferPromise> makePathTransferPromise(
        const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
        std::uint64_t diskSpaceNeeded) override;
    [[nodiscard]] std::shared_ptr<OutOfBandPromise> makeOutOfBandPromise(
        const std::string& name, CoordinationClient client, std::uint64_t diskSpaceNeeded) override;
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> makeAppPlaceholder(
        const std::string& name, const std::string& identifier, std::uint64_t installType,
        CoordinationClient client) override;
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override;
    [[nodiscard]] ErrorRecord userPresentableError(
        std::int64_t code, const std::optional<ErrorRecord>& underlying) override;
    [[nodiscard]] std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& serviceName, const std::set<CoordinationClient>& clients,
        std::weak_ptr<InstallCoordinatorObserver> delegate) override;

  private:
    void checkFound(const Coordinator& found, const std::string& identifier,
                    CoordinationClient client, Creation creation) const;
    void checkIdentifier(const InstallCoordinator& found, const std::string& identifier) const;

    InstallCoordinatorService& service_;
    WorkQueues& queues_;
    const std::chrono::nanoseconds patience_;
    const std::shared_ptr<BreachBook> book_;
    const std::shared_ptr<CoordinationWatch> watch_;
    const std::shared_ptr<CoordinatorObservers> observers_;
};

}  // namespace appsync
