#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>

#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"
#include "recording/RecordedObservers.h"

namespace appsync {

class Recording;
class RecordedCoordinatorObserver;

/// The plug-in's observers as the coordination service knows them. Whatever is handed out keeps it.
using RecordedCoordinatorObservers = RecordedObservers<RecordedCoordinatorObserver>;

class RecordedCoordination : public InstallCoordinatorService {
  public:
    RecordedCoordination(InstallCoordinatorService& inner, Recording& recording);
    ~RecordedCoordination() override;

    bool isCoordinationEnabled() override;
    Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                            CoordinationClient client, Creation creation) override;
    std::shared_ptr<InstallCoordinator> existingCoordinator(const std::string& identifier,
                                                            CoordinationClient client) override;
    std::shared_ptr<PathTransferPromise> makePathTransferPromise(
        const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
        std::uint64_t diskSpaceNeeded) override;
    std::shared_ptr<OutOfBandPromise> makeOutOfBandPromise(const std::string& name,
                                                           CoordinationClient client,
                                                           std::uint64_t diskSpaceNeeded) override;
    std::shared_ptr<InstallPlaceholder> makeAppPlaceholder(const std::string& name,
                                                           const std::string& identifier,
                                                           std::uint64_t installType,
                                                           CoordinationClient client) override;
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override;
    ErrorRecord userPresentableError(std::int64_t code,
                                     const std::optional<ErrorRecord>& underlying) override;
    std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& serviceName, const std::set<CoordinationClient>& clients,
        std::weak_ptr<InstallCoordinatorObserver> delegate) override;

  private:
    InstallCoordinatorService& inner_;
    Recording& recording_;
    const std::shared_ptr<RecordedCoordinatorObservers> observers_;
};

}  // namespace appsync
