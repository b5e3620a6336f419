#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>

#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"

namespace appsync {

class ReplayRun;

/// The coordination service of a replay: it answers as the recording says.
class ReplayCoordination : public InstallCoordinatorService {
  public:
    explicit ReplayCoordination(ReplayRun& run) : run_(run) {}

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
    ReplayRun& run_;
};

}  // namespace appsync
